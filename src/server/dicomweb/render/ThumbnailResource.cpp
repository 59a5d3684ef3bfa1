#include "server/dicomweb/render/ThumbnailResource.h"

#include "server/dicomweb/render/PictureForm.h"
#include "server/dicomweb/render/PictureTag.h"
#include "server/dicomweb/render/RenderedResource.h"
#include "server/dicomweb/render/ShownImage.h"
#include "server/dicomweb/retrieve/ImageFinder.h"
#include "server/http/EntityTag.h"

#include <kddlib/TagMap.h>

namespace Kdd::DicomWeb
{
namespace
{

/// Of one that has to be drawn and that nobody gave a size [pixels].
constexpr int kSide = 256;

const QByteArray kMediaType("image/jpeg");

/// What the tag file holds for a study, a series or an image; `image` receives the key of the image that it shows.
QByteArray previewOf(const ServedStudy& study, const ResourcePath& path, QByteArray& image)
{
    return study.look([&](const TagFile& file) -> QByteArray {
        TagMap* node = file.study().get();
        if (!path.instance.isEmpty())
            node = file.findImage(path.instance);
        else if (!path.series.isEmpty())
            node = file.findSeries(path.series);
        TagMap* owner = nullptr;
        const QByteArray preview = node != nullptr ? node->findPreviewData(&owner) : QByteArray();
        if (owner != nullptr)
            image = TagFile::imageKey(*owner);
        return preview;
    });
}

/// Previews are sent as they are stored unless a smaller one is wanted: a larger one would only be blurred.
QByteArray reduced(const QByteArray& preview, const RenderRequest& rendering)
{
    if (rendering.viewport.isEmpty())
        return preview;
    const QImage stored = QImage::fromData(preview, "JPEG");
    if (stored.isNull() ||
        (stored.width() <= rendering.viewport.width() && stored.height() <= rendering.viewport.height()))
        return preview;
    RenderRequest whole;
    whole.viewport = rendering.viewport;
    return encode(fitInto(stored, whole), kMediaType, rendering.quality);
}

Verdict drawn(const ServedStudy& study, const QByteArray& image, int frame, const RenderRequest& rendering,
              QByteArray& bytes)
{
    RenderRequest small = rendering;
    if (small.viewport.isEmpty())
        small.viewport = QSize(kSide, kSide);
    ShownImage shown;
    QImage picture;
    Verdict verdict = shown.open(study, image);
    if (verdict.good())
        verdict = shown.draw(frame, small, picture);
    // For a list it is the same why there is no picture.
    if (verdict.status == 406)
        verdict.status = 404;
    if (verdict.good())
        bytes = encode(picture, kMediaType, small.quality);
    return verdict;
}

}  // namespace

bool ThumbnailResource::owns(const ResourcePath& path) const
{
    return asksFor(path, "thumbnail");
}

Http::Response ThumbnailResource::answer(const Http::Request& request, const ResourcePath& path)
{
    RenderRequest rendering;
    std::shared_ptr<const ServedStudy> study;
    QVector<ListedImage> images;
    Verdict verdict = RenderRequest::parse(request, rendering);
    if (verdict.good() && Http::AcceptHeader::of(request).quality({kMediaType, ""}) == 0)
        verdict = {406, QStringLiteral("Thumbnails are given as image/jpeg")};
    if (verdict.good())
        verdict = findStudy(*mStudies, path, study);
    if (verdict.good())
        verdict = listImages(*study, path, images);
    if (verdict.bad())
        return verdict.response();

    int frame = FrameView::kRepresentative;
    if (path.resource == "frames") {
        bool isNumber = false;
        frame = path.rest.first().toInt(&isNumber) - 1;
        if (!isNumber || frame < 0)
            return Http::failure(400, QStringLiteral("A frame is asked for by its number, from 1 on"));
    }
    // A window or a region asks for another picture than the one that is there.
    const bool isPlain = frame == FrameView::kRepresentative && !rendering.window &&
                         request.parameter("viewport").count(',') < 2;
    QByteArray image = images.first().key;
    QByteArray bytes = previewOf(*study, path, image);
    const PictureTag picture{image, "thumbnail " + QByteArray::number(frame) + '\n' + rendering.text()};
    const bool isStored = isPlain && !bytes.isEmpty();
    QByteArray tag;
    if (isStored)
        tag = picture.ofStored(*study);
    else
        verdict = picture.ofDrawn(*study, *mObjects, tag);
    if (verdict.good() && Http::hasEntity(request, tag))
        return Http::notModified(tag);
    if (isStored)
        bytes = reduced(bytes, rendering);
    else if (verdict.good())
        verdict = drawn(*study, image, frame, rendering, bytes);
    if (verdict.good() && bytes.isEmpty())
        verdict = {500, QStringLiteral("The picture cannot be written")};
    if (verdict.bad())
        return verdict.response();
    Http::Response response = Http::textResponse(200, kMediaType, bytes);
    Http::addEntityTag(tag, response);
    return response;
}

}  // namespace Kdd::DicomWeb
