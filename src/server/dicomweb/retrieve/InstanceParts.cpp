#include "server/dicomweb/retrieve/InstanceParts.h"

#include "server/dicomweb/retrieve/BodyBlocks.h"
#include "server/dicomweb/retrieve/PixelValue.h"

#include <QByteArrayList>

#include <kddlib/KxCurlClient.h>
#include <kddlib/LogFile.h>
#include <kddlib/TagMap.h>

#include <algorithm>
#include <iterator>

namespace Kdd::DicomWeb
{

namespace
{

/// What an object can be given in beside the syntax it is stored in.
QVector<QByteArray> othersOf(const FrameIndex& index)
{
    if (!index.canDecode())
        return {};
    return QVector<QByteArray>{kExplicitLittleEndian, kImplicitLittleEndian, kDeflatedLittleEndian} +
           index.encodings();
}

Verdict chooseSyntax(const FoundObject& object, const InstanceForm& form, QByteArray& syntaxUID)
{
    const QVector<QByteArray> others = othersOf(object.index);
    syntaxUID = form.syntaxFor(object.index.transferSyntaxUID(), others);
    if (!syntaxUID.isEmpty())
        return {};
    const QByteArray known = others.isEmpty() ? QByteArray("; there is no decoder for it")
                                              : " and in " + others.toList().join(", ");
    return {406, QStringLiteral("The instance can be given in the transfer syntax ") +
                     QString::fromLatin1(object.index.transferSyntaxUID() + known)};
}

Verdict failed(const ListedImage& image, const Result& result)
{
    LogFile::errorf("Image %s cannot be served: %s", image.key.constData(), qUtf8Printable(result.text()));
    return {500, QStringLiteral("The instance cannot be made from its DICOM file")};
}

Verdict appendPixels(const ListedImage& image, const FoundObject& object, CorrectedDataset::Pixels pixels,
                     const QByteArray& syntaxUID, std::vector<Http::BodyPart>& body)
{
    using Pixels = CorrectedDataset::Pixels;
    if (pixels == Pixels::Stored && object.index.pixelValue().length > 0)
        body.push_back(object.bytes->part(object.index.pixelValue()));
    std::unique_ptr<Http::Producer> producer;
    if (pixels == Pixels::Decoded)
        producer = std::make_unique<DecodedProducer>(object);
    if (pixels == Pixels::Encoded)
        producer = std::make_unique<EncodedProducer>(object, syntaxUID);
    if (producer == nullptr)
        return {};
    QByteArray first;
    // The first frame at once, so that what cannot be decoded gets its status.
    const Result made = producer->next(first);
    if (made.bad())
        return failed(image, made);
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
                     ObjectShelf& objects, std::vector<Http::BodyPart>& body, MadeInstance& made)
{
    ImageOrigin origin;
    FoundObject object;
    std::unique_ptr<TagMap> shown;
    Verdict verdict = takeImage(study, image.key, origin, &shown);
    if (verdict.good())
        verdict = objects.open(origin, object);
    if (verdict.good())
        verdict = chooseSyntax(object, form, made.syntaxUID);
    if (verdict.bad())
        return verdict;
    CorrectedDataset dataset;
    const Result corrected = dataset.make(*object.bytes, object.index, *shown, made.syntaxUID);
    if (corrected.bad())
        return failed(image, corrected);
    if (dataset.isAsInFile()) {
        made.metaLength = object.index.datasetOffset();
        body.push_back(object.bytes->part({0, object.bytes->size()}));
        return {};
    }
    made.metaLength = dataset.metaLength();
    body.emplace_back(dataset.head().left(dataset.metaLength()));
    std::vector<Http::BodyPart> rest;
    rest.emplace_back(dataset.head().mid(dataset.metaLength()));
    verdict = appendPixels(image, object, dataset.pixels(), made.syntaxUID, rest);
    if (!dataset.tail().isEmpty())
        rest.emplace_back(dataset.tail());
    if (made.syntaxUID == kDeflatedLittleEndian)
        body.emplace_back(std::make_unique<DeflatedBody>(std::move(rest)));
    else
        std::move(rest.begin(), rest.end(), std::back_inserter(body));
    return verdict;
}

}  // namespace Kdd::DicomWeb
