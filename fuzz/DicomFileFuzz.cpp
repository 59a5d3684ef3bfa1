// What is read of a DICOM file can be put into a data set, and shows the same after it was stored in a tag file. What is
// read of it without the parser is what the parser reads.

#include "fuzz/Property.h"
#include "kddlib/Limits.h"
#include "kddlib/items/PlainFiles.h"
#include "kddlib/net/dicom/DicomFileReader.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/TagMap.h"
#include "support/TreeText.h"

#include <QDataStream>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctk.h>
#include <sys/mman.h>
#include <unistd.h>

#include <memory>
#include <string>

using namespace Kdd;

namespace
{

/// A file that takes no disk. Long values are read from it by its name after it was first read.
class MemoryFile
{
public:
    MemoryFile()
        : mDescriptor(::memfd_create("input", MFD_CLOEXEC))
        , mPath("/proc/self/fd/" + std::to_string(mDescriptor))
    {
        require(mDescriptor >= 0, "there is memory for a file");
    }
    ~MemoryFile() { ::close(mDescriptor); }
    MemoryFile(const MemoryFile&) = delete;
    MemoryFile& operator=(const MemoryFile&) = delete;

    const char* path() const { return mPath.c_str(); }

    void fill(const uint8_t* data, std::size_t size) const
    {
        require(::ftruncate(mDescriptor, 0) == 0 &&
                    ::pwrite(mDescriptor, data, size, 0) == static_cast<ssize_t>(size),
                "the file can be written");
    }

private:
    int mDescriptor;
    std::string mPath;
};

std::unique_ptr<TagMap> mapOf(const MemoryFile& input)
{
    DcmFileFormat format;
    if (readDicomFile(input.path(), format).bad())
        return nullptr;
    return std::unique_ptr<TagMap>(TagMap::createTagMap(format.getDataset(), kDefaultValueBound));
}

void checkStored(TagFile& file, const std::string& shown)
{
    QByteArray bytes;
    QDataStream out(&bytes, QIODevice::WriteOnly);
    require(file.writeCacheFile(out), "the image can be written");
    QDataStream in(bytes);
    TagFile again;
    require(again.readCacheFile(in, nullptr) && again.imagesByUID().size() == 1, "the image can be read");
    require(shownText(*again.imagesByUID().first()) == shown, "the stored image shows the same");
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, std::size_t size)
{
    static const MemoryFile input;
    input.fill(data, size);
    std::unique_ptr<TagMap> map = mapOf(input);
    const PlainRead plain = readPlain(input.path(), kDefaultValueBound);
    require(!plain.isPlain || (map != nullptr && ownText(*plain.image.map) == ownText(*map)),
            "the parser reads the same");
    if (map == nullptr)
        return 0;
    DcmDataset dataset;
    map->insertInto(dataset);

    const std::string shown = shownText(*map);
    TagFile::setCompressionMode(TagFile::CompressionMode::None);
    TagFile file;
    const TagMap* image = file.addTagMap(map.release(), nullptr, false);
    if (image == nullptr)
        return 0;
    require(shownText(*image) == shown, "the image shows the same in its study");
    checkStored(file, shown);
    return 0;
}
