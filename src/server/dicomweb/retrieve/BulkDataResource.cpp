#include "server/dicomweb/retrieve/BulkDataResource.h"

#include "server/dicomweb/retrieve/BulkValue.h"
#include "server/dicomweb/retrieve/EntriesProducer.h"
#include "server/dicomweb/retrieve/PixelBody.h"
#include "server/dicomweb/retrieve/PixelValue.h"
#include "server/dicomweb/retrieve/ValueAnswer.h"
#include "server/http/MultipartWriter.h"

#include <numeric>

namespace Kdd::DicomWeb
{

namespace
{

/// The value as the only part.
Http::Response asPart(const BulkValue& value, const QByteArray& mediaType, const QByteArray& contentType)
{
    Http::MultipartWriter packing(mediaType);
    Http::Response response;
    response.addHeader("Content-Type", packing.mediaType());
    response.body.emplace_back(packing.begin({}, contentType));
    value.append(0, value.length(), response.body);
    response.body.emplace_back(packing.end() + packing.finish());
    return response;
}

/// A value that is no pixels.
Http::Response answerValue(const Http::Request& request, const BulkValue& value)
{
    const QVector<Http::MediaType> offers = {{value.mediaType, {}},
                                             {kOctetStream, {}},
                                             {"multipart/related", value.mediaType},
                                             {"multipart/related", kOctetStream}};
    const int chosen = Http::AcceptHeader::of(request).choose(offers);
    if (chosen < 0)
        return Http::failure(406, QStringLiteral("The value can be given as ") +
                                      QString::fromLatin1(value.mediaType));
    const Http::MediaType& offer = offers.at(chosen);
    return offer.parts.isEmpty() ? alone(request, value, offer.name)
                                 : asPart(value, offer.parts, offer.parts);
}

QVector<int> allFrames(const FrameIndex& index)
{
    QVector<int> frames(index.frames());
    std::iota(frames.begin(), frames.end(), 0);
    return frames;
}

/// The pixels of one image, all frames.
Http::Response answerPixels(const Http::Request& request, const FoundObject& object)
{
    const auto accept = Http::AcceptHeader::of(request);
    const FrameIndex& index = object.index;
    PixelForm form;
    if (!index.hasPixels())
        return Http::failure(404, QStringLiteral("The instance has no pixels"));
    PixelOffer offer = pixelOfferOf(index, isOneValue(index) ? 1 : index.frames());
    offer.encodings.clear();  // values are given as they are, frames in other forms
    offer.prefersSingle = true;
    if (choosePixelForm(accept, offer, form)) {
        if (!isOneValue(index))
            return framesAsParts(object, allFrames(index), form);
        BulkValue value;
        const Verdict found = form.isStored ? storedPixels(object, value) : decodedPixels(object, value);
        if (found.bad())
            return found.response();
        return form.isSinglePart ? alone(request, value, form.contentType())
                                 : asPart(value, form.mediaType, form.contentType());
    }
    // All frames of a compressed image are one stretch of bytes only when they are decoded.
    offer = PixelOffer{kExplicitLittleEndian, true, true, true, {}};
    if (!index.canDecode() || !choosePixelForm(accept, offer, form))
        return noSuitablePixels(index).response();
    Http::Response response;
    response.addHeader("Content-Type", form.contentType());
    response.body.emplace_back(std::make_unique<DecodedProducer>(object));
    return response;
}

/// The value's path, relative to the one of the request; empty when it has none because the image has no sensible UIDs.
QByteArray placeOf(const ResourcePath& path, const ListedImage& image, const QVector<ElementStep>& steps)
{
    if (!isUID(image.seriesUID) || !isUID(image.sopUID))
        return {};
    QByteArray place;
    if (path.series.isEmpty())
        place += "series/" + image.seriesUID + '/';
    if (path.instance.isEmpty())
        place += "instances/" + image.sopUID + '/';
    return place + "bulkdata/" + textOf(steps);
}

/// What of the pixels of many images goes into one answer.
Verdict choosePart(const Http::AcceptHeader& accept, const FoundObject& object, PixelForm& form)
{
    if (!object.index.hasPixels())
        return {404, QStringLiteral("No instance has pixels")};
    PixelOffer offer = pixelOfferOf(object.index, object.index.frames());
    offer.encodings.clear();
    offer.canBeSingle = false;
    return choosePixelForm(accept, offer, form) ? Verdict() : noSuitablePixels(object.index);
}

Verdict addPixels(const Http::AcceptHeader& accept, const FoundObject& object, const QByteArray& place,
                  std::vector<Entry>& entries)
{
    PixelForm form;
    const Verdict chosen = choosePart(accept, object, form);
    if (chosen.bad())
        return {};
    BulkValue value;
    if (form.isStored && isOneValue(object.index)) {
        const Verdict found = storedPixels(object, value);
        entries.push_back({place, form.contentType(), {}});
        if (found.good())
            value.append(0, value.length(), entries.back().body);
        return found;
    }
    for (int frame = 0; frame < object.index.frames(); ++frame) {
        entries.push_back({{}, form.contentType(), {}});
        if (form.isStored) {
            const Verdict appended = appendFrame(object, frame, form, entries.back().body);
            if (appended.bad())
                return appended;
        } else {
            entries.back().body.emplace_back(
                std::make_unique<FramesProducer>(object, QVector<int>{frame}, form, nullptr));
        }
    }
    return {};
}

bool takesParts(const Http::AcceptHeader& accept)
{
    return accept.quality({"multipart/related", kOctetStream}) > 0;
}

}  // namespace

bool BulkDataResource::owns(const ResourcePath& path) const
{
    const bool isAll = path.rest.isEmpty() && !path.study.isEmpty();
    return (path.resource == "pixeldata" && isAll) ||
           (path.resource == "bulkdata" && (isAll || !path.instance.isEmpty()));
}

Http::Response BulkDataResource::answer(const Http::Request& request, const ResourcePath& path)
{
    std::shared_ptr<const ServedStudy> study;
    QVector<ListedImage> images;
    QVector<ElementStep> steps;
    const bool isValue = !path.rest.isEmpty();
    if (isValue && !readSteps(path.rest, steps))
        return Http::failure(
            400, QStringLiteral("Values are named by keys of eight hexadecimal digits, with the "
                                "number of an item between those of a sequence and of its attribute"));
    Verdict verdict = findStudy(*mStudies, path, study);
    if (verdict.good())
        verdict = listImages(*study, path, images);
    if (verdict.bad())
        return verdict.response();

    const bool isPixels =
        isValue ? leadToPixels(steps) : path.resource == "pixeldata" && !path.instance.isEmpty();
    if (isPixels) {
        ImageOrigin origin;
        FoundObject object;
        verdict = takeImage(*study, images.first().key, origin, nullptr);
        if (verdict.good())
            verdict = mObjects->open(origin, object);
        return verdict.good() ? answerPixels(request, object) : verdict.response();
    }
    if (isValue) {
        BulkValue value;
        verdict = findBulkValue(*study, images.first(), steps, *mObjects, value);
        return verdict.good() ? answerValue(request, value) : verdict.response();
    }
    return answerAll(Http::AcceptHeader::of(request), path, study, images);
}

/// The values of many images. What they are differs, so that the header names bytes and each part what it is.
Http::Response BulkDataResource::answerAll(const Http::AcceptHeader& accept, const ResourcePath& path,
                                           const std::shared_ptr<const ServedStudy>& study,
                                           const QVector<ListedImage>& images)
{
    const bool isPixels = path.resource == "pixeldata";
    QVector<ListedImage> kept;
    Verdict first{404, QStringLiteral("There are no such values")};
    for (const ListedImage& image : images) {
        ImageOrigin origin;
        FoundObject object;
        PixelForm form;
        const bool hasValues = !isPixels && takesParts(accept) && !omittedValues(*study, image).isEmpty();
        Verdict verdict = hasValues ? Verdict() : takeImage(*study, image.key, origin, nullptr);
        if (verdict.good() && !hasValues)
            verdict = mObjects->open(origin, object);
        if (verdict.good() && !hasValues)
            verdict = choosePart(accept, object, form);
        if (verdict.good())
            kept.append(image);
        else if (verdict.status != 404)
            first = verdict;
    }
    if (kept.isEmpty())
        return first.response();

    const auto make = [=, objects = mObjects](int number, std::vector<Entry>& entries) {
        const ListedImage& image = kept.at(number);
        ImageOrigin origin;
        FoundObject object;
        Verdict verdict = takeImage(*study, image.key, origin, nullptr);
        if (verdict.good())
            verdict = objects->open(origin, object);
        if (verdict.bad() || isPixels)
            return verdict.bad() ? verdict : addPixels(accept, object, {}, entries);
        for (const QVector<ElementStep>& steps : omittedValues(*study, image)) {
            BulkValue value;
            verdict = leadToPixels(steps) ? addPixels(accept, object, placeOf(path, image, steps), entries)
                                          : findBulkValue(*study, image, steps, *objects, value);
            if (verdict.bad())
                return verdict;
            if (leadToPixels(steps))
                continue;
            entries.push_back({placeOf(path, image, steps), value.mediaType, {}});
            value.append(0, value.length(), entries.back().body);
        }
        return verdict;
    };
    auto packing = std::make_unique<Http::MultipartWriter>(kOctetStream);
    Http::Response response;
    response.addHeader("Content-Type", packing->mediaType());
    response.body.emplace_back(std::make_unique<EntriesProducer>(kept.size(), make, std::move(packing)));
    return response;
}

}  // namespace Kdd::DicomWeb
