#pragma once

#include "server/dicomweb/retrieve/BulkValue.h"

#include <kddlib/CorrectedDataset.h>

namespace Kdd::DicomWeb
{

/// Whether all pixels of an object are one stretch of bytes as they are stored: those without compression, the one frame
/// of an image, a video.
bool isOneValue(const FrameIndex& index);

/// The pixels of such an object as they are stored.
Verdict storedPixels(const FoundObject& object, BulkValue& value);

/// The only frame of an object, decoded.
Verdict decodedPixels(const FoundObject& object, BulkValue& value);

/// Decodes the pixels of an object as they are sent, as an uncompressed dataset would hold them.
class DecodedProducer : public Http::Producer
{
public:
    explicit DecodedProducer(const FoundObject& object)
        : mBytes(object.bytes)
        , mPixels(*mBytes, object.index)
    {
    }

    Result next(QByteArray& block) override { return mPixels.next(block); }

private:
    std::shared_ptr<StoredObject> mBytes;
    DecodedPixels mPixels;
};

/// Encodes them as they are sent, as a dataset in another syntax with compression would hold them.
class EncodedProducer : public Http::Producer
{
public:
    EncodedProducer(const FoundObject& object, const QByteArray& syntaxUID)
        : mBytes(object.bytes)
        , mPixels(*mBytes, object.index, syntaxUID)
    {
    }

    Result next(QByteArray& block) override { return mPixels.next(block); }

private:
    std::shared_ptr<StoredObject> mBytes;
    EncodedPixels mPixels;
};

}  // namespace Kdd::DicomWeb
