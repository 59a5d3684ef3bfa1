#include "server/browser/StudySizes.h"

#include <kddlib/OwnAttributes.h>
#include <kddlib/TagElement.h>
#include <kddlib/TagFile.h>
#include <kddlib/TagMap.h>
#include <kddlib/TagSequence.h>
#include <sys/stat.h>

namespace Kdd::Browser
{
namespace
{

qint64 encodedSize(const TagMap& node);

qint64 encodedSize(const TagElement& element)
{
    // Tag, VR and length; items and sequences with delimiters have about the same.
    constexpr qint64 kHead = 8;
    if (!element.isSequence())
        return kHead + element.value().size() + element.value().size() % 2;
    const auto& sequence = static_cast<const TagSequence&>(element);
    qint64 size = kHead;
    for (int i = 0; i < sequence.numItems(); ++i)
        size += kHead + encodedSize(sequence.itemToRead(i));
    return size;
}

qint64 encodedSize(const TagMap& node)
{
    qint64 size = 0;
    const TagMap::iterator end = node.end();
    for (auto it = node.begin(); it != end; ++it)
        if (it.key().getGroup() != 0x0006 && !it.value()->markedAsOmitted())
            size += encodedSize(*it.value());
    return size;
}

/// Of a regular file [bytes]; -1 where there is none.
qint64 sizeOf(const QByteArray& path)
{
    struct stat found = {};
    return ::stat(path.constData(), &found) == 0 && S_ISREG(found.st_mode) ? qint64(found.st_size) : -1;
}

}  // namespace

StudyFiles filesOf(const TagFile& file)
{
    StudyFiles files;
    for (const TagMap* image : file.imagesByUID()) {
        files.paths.append(filePathOf(*image));
        files.attributeBytes += encodedSize(*image);
    }
    return files;
}

QJsonObject sizesJson(const StudyFiles& files)
{
    qint64 bytes = 0;
    int missing = 0;
    for (const QByteArray& path : files.paths) {
        const qint64 size = sizeOf(path);
        bytes += qMax(size, qint64(0));
        missing += size < 0 ? 1 : 0;
    }
    return {{QStringLiteral("files"), files.paths.size()},
            {QStringLiteral("missing"), missing},
            {QStringLiteral("dicom"), bytes},
            {QStringLiteral("attributes"), files.attributeBytes}};
}

}  // namespace Kdd::Browser
