// A tag file that is accepted is written as bytes that stay the same when they are read and written again, and its
// images show the same before and after: read back, optimised, and read back optimised.

#include "fuzz/Property.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"
#include "support/TreeText.h"

#include <QDataStream>

#include <algorithm>
#include <string>

using namespace Kdd;

namespace
{

/// Every image shows what its study holds, so the text of a larger tree would take all the time.
constexpr int kMaxSize = 16 * 1024;

bool read(TagFile& file, const QByteArray& bytes)
{
    QDataStream in(bytes);
    return file.readCacheFile(in, nullptr);
}

QByteArray written(TagFile& file)
{
    QByteArray bytes;
    QDataStream out(&bytes, QIODevice::WriteOnly);
    require(file.writeCacheFile(out), "what was read can be written");
    return bytes;
}

bool isSmall(const TagFile& file)
{
    int unused = 0;
    int size = 0;
    file.getStatistics(unused, unused, unused, unused, unused, unused, unused, unused, size, unused, unused);
    return size <= kMaxSize;
}

/// Writers keep previews beside the records and readers make them OB. One of another VR stands in a record itself,
/// where no writer puts it, and becomes OB.
bool hasForeignPreview(const std::string& shown)
{
    static const std::string kKey = "0006,7105 ";
    static const std::string kBytes = std::to_string(static_cast<int>(VrCode::OB)) + ' ';
    for (std::size_t at = shown.find(kKey); at != std::string::npos; at = shown.find(kKey, at + 1)) {
        if (shown.compare(at + kKey.size(), kBytes.size(), kBytes) != 0)
            return true;
    }
    return false;
}

/// A mark that names a volume for an image it has no slice of goes when the study is written: what the volumes have counts.
std::string withoutMarks(const std::string& shown)
{
    std::string rest;
    std::size_t end = 0;
    for (std::size_t at = 0; at < shown.size(); at = end) {
        end = std::min(shown.find('\n', at), shown.size() - 1) + 1;
        if (shown.compare(at, 10, " 0006,7103") != 0)
            rest.append(shown, at, end - at);
    }
    return rest;
}

/// Where images or series say that they are of another study, which no writer lets them, the one that most of them say
/// becomes that of the study when it is optimised, and it is not written any more.
bool isOneStudy(const TagFile& file)
{
    const QByteArray uid = file.study()->uid(TagMap::StudyLevel);
    for (const TagMap* image : file.imagesByUID()) {
        if (image->uid(TagMap::StudyLevel) != uid)
            return false;
    }
    return true;
}

void checkIndex(const TagFile& file)
{
    int images = 0;
    for (const TagMap* series : file.study()->children())
        images += series->children().size();
    require(images == file.imagesByUID().size(), "every image of the tree is indexed");
}

void checkLookUps(const TagMap& node)
{
    const TagMap::iterator end = node.end();
    for (const TagMap* holder = &node; holder != nullptr; holder = holder->parent()) {
        for (const DcmTagKey& key : holder->tagsForLevel().keys()) {
            const TagElement* found = node.findElement(key);
            const TagMap::iterator it = node.lowerBound(key);
            require(found == nullptr || (it != end && it.value() == found),
                    "what is found is also walked over");
        }
    }
    for (TagMap::iterator it = node.begin(); it != end; ++it) {
        require(node.findElement(it.key()) == it.value(), "what is walked over is also found");
        if (!it.value()->isSequence())
            continue;
        const auto& sequence = static_cast<const TagSequence&>(*it.value());
        for (int i = 0; i < sequence.numItems(); ++i)
            checkLookUps(*sequence.item(i));
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, std::size_t size)
{
    TagFile::setCompressionMode(TagFile::CompressionMode::None);
    TagFile file;
    if (!read(file, bytesOf(data, size)) || file.imagesByUID().isEmpty() || !isSmall(file))
        return 0;
    checkIndex(file);
    for (const TagMap* image : file.imagesByUID())
        checkLookUps(*image);
    const std::string before = imagesText(file);
    if (hasForeignPreview(before))
        return 0;

    const QByteArray bytes = written(file);
    const std::string shown = imagesText(file);
    require(withoutMarks(shown) == withoutMarks(before), "writing changes nothing but marks of volumes");
    TagFile again;
    require(read(again, bytes), "what was written can be read");
    require(imagesText(again) == shown, "what was written shows the same");
    require(written(again) == bytes, "what was written is written again byte for byte");
    if (!isOneStudy(file))
        return 0;

    again.optimizeAll();
    require(imagesText(again) == shown, "what is optimised shows the same");
    TagFile optimised;
    require(read(optimised, written(again)), "what is optimised can be read");
    require(imagesText(optimised) == shown, "what is optimised, written and read shows the same");
    return 0;
}
