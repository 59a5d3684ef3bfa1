#include "server/dicomweb/render/RenderedResource.h"

#include "server/dicomweb/render/PictureForm.h"
#include "server/dicomweb/render/PictureTag.h"
#include "server/dicomweb/render/ShownImage.h"
#include "server/dicomweb/render/WholeValue.h"
#include "server/dicomweb/retrieve/EntriesProducer.h"
#include "server/dicomweb/retrieve/ImageFinder.h"
#include "server/http/EntityTag.h"
#include "server/http/MultipartWriter.h"

#include <QList>

#include <kddlib/TagMap.h>

namespace Kdd::DicomWeb
{
namespace
{

// Each is decoded and packed anew; more than a viewer shows at once would keep the server busy for minutes.
constexpr int kMostPictures = 1000;

/// The frames that a path names, 0-based; empty when it names none.
Verdict framesOf(const ResourcePath& path, QVector<int>& frames)
{
    if (path.resource != "frames")
        return {};
    for (const QByteArray& word : path.rest.first().split(',')) {
        bool isNumber = false;
        const int number = word.toInt(&isNumber);
        if (!isNumber || number < 1 || frames.size() == kMostPictures)
            return {400, QStringLiteral("Frames are asked for by numbers from 1 on, separated by commas")};
        frames.append(number - 1);
    }
    return {};
}

/// A picture that is asked for.
struct Wanted
{
    QByteArray image;  // its key
    int frame = FrameView::kRepresentative;
};

/// The image that stands for a study or series; the first one where no preview tells.
QByteArray representativeOf(const ServedStudy& study, const ResourcePath& path,
                            const QVector<ListedImage>& images)
{
    return study.look([&](const TagFile& file) {
        TagMap* node = path.series.isEmpty() ? file.study().get() : file.findSeries(path.series);
        TagMap* image = nullptr;
        if (node != nullptr)
            node->findPreviewData(&image);
        return image != nullptr ? TagFile::imageKey(*image) : images.first().key;
    });
}

Verdict drawn(const ServedStudy& study, const Wanted& wanted, const RenderRequest& rendering,
              const QByteArray& mediaType, QByteArray& bytes)
{
    ShownImage image;
    QImage picture;
    Verdict verdict = image.open(study, wanted.image);
    if (verdict.good())
        verdict = image.draw(wanted.frame, rendering, picture);
    if (verdict.bad())
        return verdict;
    bytes = encode(picture, mediaType, rendering.quality);
    return bytes.isEmpty() ? Verdict{500, QStringLiteral("The picture cannot be written")} : Verdict{};
}

Http::Response one(const Http::Request& request, const ServedStudy& study, const Wanted& wanted,
                   const RenderRequest& rendering, const QByteArray& mediaType, ObjectShelf& objects)
{
    const PictureTag picture{wanted.image,
                             QByteArray::number(wanted.frame) + '\n' + rendering.text() + mediaType};
    QByteArray tag;
    QByteArray bytes;
    Verdict verdict = picture.ofDrawn(study, objects, tag);
    if (verdict.good() && Http::hasEntity(request, tag))
        return Http::notModified(tag);
    if (verdict.good())
        verdict = drawn(study, wanted, rendering, mediaType, bytes);
    if (verdict.bad())
        return verdict.response();
    Http::Response response = Http::textResponse(200, mediaType, bytes);
    Http::addEntityTag(tag, response);
    return response;
}

/// All pictures of what a path names.
Verdict listWanted(const ServedStudy& study, const QVector<ListedImage>& images, const QVector<int>& frames,
                   QVector<Wanted>& wanted)
{
    for (int frame : frames)
        wanted.append({images.first().key, frame});
    if (!frames.isEmpty())
        return {};
    if (images.size() > 1) {
        for (const ListedImage& image : images)
            wanted.append({image.key, FrameView::kRepresentative});
    } else {
        ShownImage image;
        const Verdict opened = image.open(study, images.first().key);
        if (opened.bad())
            return opened;
        for (int frame = 0; frame < image.frames(); ++frame)
            wanted.append({images.first().key, frame});
    }
    if (wanted.isEmpty())
        return {404, QStringLiteral("The instance has no pixels")};
    if (wanted.size() > kMostPictures)
        return {413, QStringLiteral("These are %1 pictures; at most %2 are drawn at once")
                         .arg(wanted.size())
                         .arg(kMostPictures)};
    return {};
}

Http::Response asParts(const std::shared_ptr<const ServedStudy>& study, const QVector<Wanted>& wanted,
                       const RenderRequest& rendering, const QByteArray& mediaType)
{
    // Images of a series without pixels are passed over: the others are what was asked for.
    const bool isStrict = wanted.size() == 1;
    auto packing = std::make_unique<Http::MultipartWriter>(mediaType);
    Http::Response response;
    response.addHeader("Content-Type", packing->mediaType());
    const auto make = [=](int number, std::vector<Entry>& entries) -> Verdict {
        Entry entry;
        entry.mediaType = mediaType;
        QByteArray bytes;
        const Verdict verdict = drawn(*study, wanted[number], rendering, mediaType, bytes);
        if (verdict.bad())
            return isStrict || verdict.status >= 500 ? verdict : Verdict{};
        entry.body.emplace_back(bytes);
        entries.push_back(std::move(entry));
        return {};
    };
    response.body.emplace_back(std::make_unique<EntriesProducer>(wanted.size(), make, std::move(packing)));
    return response;
}

}  // namespace

bool asksFor(const ResourcePath& path, const char* name)
{
    if (path.study.isEmpty())
        return false;
    if (path.resource == name)
        return path.rest.isEmpty();
    return path.resource == "frames" && !path.instance.isEmpty() && path.rest.size() == 2 &&
           path.rest[1] == name;
}

bool RenderedResource::owns(const ResourcePath& path) const
{
    return asksFor(path, "rendered");
}

Http::Response RenderedResource::answer(const Http::Request& request, const ResourcePath& path)
{
    RenderRequest rendering;
    const Verdict verdict = RenderRequest::parse(request, rendering);
    return verdict.good() ? show(request, Http::AcceptHeader::of(request), rendering, path)
                          : verdict.response();
}

Http::Response RenderedResource::show(const Http::Request& request, const Http::AcceptHeader& accept,
                                      const RenderRequest& rendering, const ResourcePath& path)
{
    PictureForm form;
    QVector<int> frames;
    std::shared_ptr<const ServedStudy> study;
    QVector<ListedImage> images;
    Verdict verdict = framesOf(path, frames);
    if (verdict.good())
        verdict = findStudy(*mStudies, path, study);
    if (verdict.good())
        verdict = listImages(*study, path, images);
    if (verdict.bad())
        return verdict.response();
    if (!path.instance.isEmpty() && frames.isEmpty()) {
        std::optional<Http::Response> whole = showWhole(request, accept, *study, images.first(), *mObjects);
        if (whole)
            return std::move(*whole);
    }
    verdict = PictureForm::choose(accept, form);
    if (verdict.bad())
        return verdict.response();

    if (form.isMultipart) {
        QVector<Wanted> wanted;
        verdict = listWanted(*study, images, frames, wanted);
        return verdict.good() ? asParts(study, wanted, rendering, form.mediaType) : verdict.response();
    }
    if (frames.size() > 1)
        return Http::failure(406, QStringLiteral("Several pictures are given as multipart/related only"));
    const QByteArray key =
        path.instance.isEmpty() ? representativeOf(*study, path, images) : images.first().key;
    return one(request, *study, {key, frames.value(0, FrameView::kRepresentative)}, rendering, form.mediaType,
               *mObjects);
}

}  // namespace Kdd::DicomWeb
