#include "server/dicomweb/retrieve/PixelValue.h"

#include "server/dicomweb/retrieve/PixelBody.h"

namespace Kdd::DicomWeb
{

bool isOneValue(const FrameIndex& index)
{
    return !index.isEncapsulated() || index.frames() == 1;
}

Verdict storedPixels(const FoundObject& object, BulkValue& value)
{
    value.source = object.bytes;
    value.stretches = {object.index.pixelValue()};
    if (object.index.isEncapsulated() && object.index.locate(0, value.stretches).bad())
        return {500, QStringLiteral("The pixels are damaged")};
    if (!object.identity.isEmpty())
        value.etag = etagOf(object.identity, "stored pixels");
    return {};
}

Verdict decodedPixels(const FoundObject& object, BulkValue& value)
{
    QByteArray bytes;
    const Result decoded = object.index.readDecoded(*object.bytes, 0, bytes);
    if (decoded.bad())
        return damagedFrame(0, decoded);
    value.source = std::make_shared<MemoryObject>(bytes, object.identity);
    value.stretches = {{0, bytes.size()}};
    if (!object.identity.isEmpty())
        value.etag = etagOf(object.identity, "decoded pixels");
    return {};
}

}  // namespace Kdd::DicomWeb
