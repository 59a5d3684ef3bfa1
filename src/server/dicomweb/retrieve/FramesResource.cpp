#include "server/dicomweb/retrieve/FramesResource.h"

#include "server/dicomweb/retrieve/ImageFinder.h"
#include "server/dicomweb/retrieve/PixelBody.h"

namespace Kdd::DicomWeb
{

namespace
{

/// Viewers ask for one, players for some dozens. Each costs entries of a list before the first byte is sent.
constexpr int kMostFrames = 10000;

/// The numbers of a list such as "1,2,5", 0-based then.
Verdict readFrames(const QByteArray& text, QVector<int>& frames)
{
    for (const QByteArray& word : text.split(',')) {
        bool isNumber = false;
        const int number = word.toInt(&isNumber);
        // No sign, no blank: what looks different is different to others that read the path.
        if (!isNumber || word.at(0) < '0' || word.at(0) > '9')
            return {400, QStringLiteral("Frames are asked for by numbers, separated by commas")};
        if (frames.size() == kMostFrames)
            return {400, QStringLiteral("At most %1 frames can be asked for at once").arg(kMostFrames)};
        frames.append(number - 1);
    }
    return {};
}

Verdict checkFrames(const FrameIndex& index, const QVector<int>& frames)
{
    if (!index.hasPixels())
        return {404, QStringLiteral("The instance has no pixels")};
    for (int frame : frames) {
        if (frame < 0 || frame >= index.frames())
            return {
                404,
                QStringLiteral("There is no frame %1 among %2").arg(qint64(frame) + 1).arg(index.frames())};
    }
    return {};
}

Http::Response singlePart(const FoundObject& object, int frame, const PixelForm& form)
{
    Http::Response response;
    const Verdict appended = appendFrame(object, frame, form, response.body);
    if (appended.bad())
        return appended.response();
    response.addHeader("Content-Type", form.contentType());
    return response;
}

}  // namespace

bool FramesResource::owns(const ResourcePath& path) const
{
    return path.resource == "frames" && path.rest.size() == 1 && !path.instance.isEmpty();
}

Http::Response FramesResource::answer(const Http::Request& request, const ResourcePath& path)
{
    QVector<int> frames;
    std::shared_ptr<const ServedStudy> study;
    QVector<ListedImage> images;
    ImageOrigin origin;
    FoundObject object;
    Verdict verdict = readFrames(path.rest.first(), frames);
    if (verdict.good())
        verdict = findStudy(*mStudies, path, study);
    if (verdict.good())
        verdict = listImages(*study, path, images);
    if (verdict.good())
        verdict = takeImage(*study, images.first().key, origin, nullptr);
    if (verdict.good())
        verdict = mObjects->open(origin, object);
    if (verdict.good())
        verdict = checkFrames(object.index, frames);
    if (verdict.bad())
        return verdict.response();

    PixelForm form;
    const PixelOffer offer = pixelOfferOf(object.index, frames.size());
    if (!choosePixelForm(Http::AcceptHeader::of(request), offer, form))
        return noSuitablePixels(object.index).response();
    return form.isSinglePart ? singlePart(object, frames.first(), form) : framesAsParts(object, frames, form);
}

}  // namespace Kdd::DicomWeb
