#pragma once

#include "server/dicomweb/MediaTypes.h"
#include "server/dicomweb/Verdict.h"
#include "server/dicomweb/retrieve/ObjectShelf.h"
#include "server/http/Packing.h"

#include <QVector>

namespace Kdd::DicomWeb
{

/// What can be offered of the frames of an object; `frames` is how many are asked for.
PixelOffer pixelOfferOf(const FrameIndex& index, int frames);

/// Why nothing of that suits the client.
Verdict noSuitablePixels(const FrameIndex& index);

/// That a frame (0-based) cannot be given; the log has the reason.
Verdict damagedFrame(int frame, const Result& result);

/// Appends a frame (0-based) in that form to a body. Stored bytes are left where they lie until they are sent.
Verdict appendFrame(const FoundObject& object, int frame, const PixelForm& form,
                    std::vector<Http::BodyPart>& body);

/// Decodes the frames of an object one after another, as they are sent.
class FramesProducer : public Http::Producer
{
public:
    /// With a packing each frame (0-based) is a part of its own, and the packing is finished behind the last.
    FramesProducer(FoundObject object, QVector<int> frames, const PixelForm& form,
                   std::unique_ptr<Http::Packing> packing)
        : mObject(std::move(object))
        , mFrames(std::move(frames))
        , mForm(form)
        , mPacking(std::move(packing))
    {
    }

    Result next(QByteArray& block) override;

private:
    FoundObject mObject;
    QVector<int> mFrames;
    PixelForm mForm;
    std::unique_ptr<Http::Packing> mPacking;
    int mNext = 0;
};

/// Frames (0-based) as a multipart answer, in that order.
Http::Response framesAsParts(const FoundObject& object, const QVector<int>& frames, const PixelForm& form);

}  // namespace Kdd::DicomWeb
