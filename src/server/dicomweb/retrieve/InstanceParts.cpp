#include "server/dicomweb/retrieve/InstanceParts.h"

#include "server/dicomweb/retrieve/PixelValue.h"

#include <kddlib/KxCurlClient.h>
#include <kddlib/LogFile.h>
#include <kddlib/TagMap.h>

namespace Kdd::DicomWeb
{

namespace
{

Verdict chooseSyntax(const FoundObject& object, const InstanceForm& form, QByteArray& syntaxUID)
{
    syntaxUID = form.syntaxFor(object.index.transferSyntaxUID(), object.index.canDecode());
    if (!syntaxUID.isEmpty())
        return {};
    const QString others = object.index.canDecode()
                               ? QStringLiteral(" and in the syntaxes without compression in little endian")
                               : QStringLiteral("; there is no decoder for it");
    return {406, QStringLiteral("The instance can be given in the transfer syntax %1%2")
                     .arg(QString::fromLatin1(object.index.transferSyntaxUID()), others)};
}

Verdict failed(const ListedImage& image, const Result& result)
{
    LogFile::errorf("Image %s cannot be served: %s", image.key.constData(), qUtf8Printable(result.text()));
    return {500, QStringLiteral("The instance cannot be made from its DICOM file")};
}

Verdict appendPixels(const ListedImage& image, const FoundObject& object, CorrectedDataset::Pixels pixels,
                     std::vector<Http::BodyPart>& body)
{
    using Pixels = CorrectedDataset::Pixels;
    if (pixels == Pixels::Stored && object.index.pixelValue().length > 0)
        body.push_back(object.bytes->part(object.index.pixelValue()));
    if (pixels != Pixels::Decoded)
        return {};
    auto producer = std::make_unique<DecodedProducer>(object);
    QByteArray first;
    // The first frame at once, so that what cannot be decoded gets its status.
    const Result decoded = producer->next(first);
    if (decoded.bad())
        return failed(image, decoded);
    body.emplace_back(first);
    body.emplace_back(std::move(producer));
    return {};
}

}  // namespace

Verdict checkInstance(const ServedStudy& study, const ListedImage& image, const InstanceForm& form,
                      ObjectShelf& objects)
{
    ImageOrigin origin;
    FoundObject object;
    QByteArray syntaxUID;
    Verdict verdict = takeImage(study, image.key, origin, nullptr);
    if (verdict.bad() || KxCurlClient::isUrl(origin.path.constData()))
        return verdict;
    verdict = objects.open(origin, object);
    return verdict.bad() ? verdict : chooseSyntax(object, form, syntaxUID);
}

Verdict makeInstance(const ServedStudy& study, const ListedImage& image, const InstanceForm& form,
                     ObjectShelf& objects, std::vector<Http::BodyPart>& body, QByteArray& syntaxUID)
{
    ImageOrigin origin;
    FoundObject object;
    std::unique_ptr<TagMap> shown;
    Verdict verdict = takeImage(study, image.key, origin, &shown);
    if (verdict.good())
        verdict = objects.open(origin, object);
    if (verdict.good())
        verdict = chooseSyntax(object, form, syntaxUID);
    if (verdict.bad())
        return verdict;
    CorrectedDataset dataset;
    const Result made = dataset.make(*object.bytes, object.index, *shown, syntaxUID);
    if (made.bad())
        return failed(image, made);
    if (dataset.isAsInFile()) {
        body.push_back(object.bytes->part({0, object.bytes->size()}));
        return {};
    }
    body.emplace_back(dataset.head());
    verdict = appendPixels(image, object, dataset.pixels(), body);
    if (!dataset.tail().isEmpty())
        body.emplace_back(dataset.tail());
    return verdict;
}

}  // namespace Kdd::DicomWeb
