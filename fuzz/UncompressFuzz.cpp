// What is accepted keeps to the limit and comes back the same when it is compressed again. The first byte chooses the
// compression.

#include "fuzz/Property.h"
#include "platform/compression/LzmaCompress.h"
#include "platform/compression/QxCompress.h"

using namespace Kdd;

namespace
{

constexpr qint64 kLimit = 1024 * 1024;

enum class Compression { Zlib, Lzma };

QByteArray uncompress(Compression compression, const QByteArray& bytes)
{
    return compression == Compression::Lzma ? lzmaUncompress(bytes, kLimit) : qxUncompress(bytes, kLimit);
}

QByteArray compress(Compression compression, const QByteArray& content)
{
    if (compression == Compression::Lzma)
        return lzmaCompress(content);
    return qxCompress(reinterpret_cast<const unsigned char*>(content.constData()), content.size());
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, std::size_t size)
{
    if (size == 0)
        return 0;
    const Compression compression = (data[0] & 1) != 0 ? Compression::Lzma : Compression::Zlib;
    const QByteArray content = uncompress(compression, bytesOf(data + 1, size - 1));
    if (content.isNull())
        return 0;
    require(content.size() <= kLimit, "the content is no longer than the limit");
    const QByteArray again = uncompress(compression, compress(compression, content));
    require(!again.isNull() && again == content, "the content comes back the same");
    return 0;
}
