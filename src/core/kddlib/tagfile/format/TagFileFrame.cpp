#include "kddlib/tagfile/format/TagFileFrame.h"

#include <limits>

namespace Kdd
{

namespace
{

/// In 64 bits: each picture fits an int, but not all together.
qint64 totalSize(const QList<QByteArray>& blobs)
{
    qint64 total = 0;
    for (const QByteArray& blob : blobs)
        total += blob.size();
    return total;
}

/// The table of blobs has no bound of its own, so what it adds up to may be more than the figures can tell.
int asInt(qint64 value)
{
    return static_cast<int>(qMin<qint64>(value, std::numeric_limits<int>::max()));
}

}  // namespace

qint64 sizeAround(const QList<QByteArray>& blobs)
{
    return kFrameSize + qint64(kBlobFrameSize) * blobs.size() + totalSize(blobs);
}

void recordSizes(qint64 storedBody, qint64 body, const QList<QByteArray>& blobs, FileSizes& sizes)
{
    const qint64 around = sizeAround(blobs);
    sizes.blobs = blobs.size();
    sizes.blobBytes = asInt(totalSize(blobs));
    sizes.storedSize = asInt(storedBody + around);
    sizes.uncompressedSize = asInt(body + around);
}

}  // namespace Kdd
