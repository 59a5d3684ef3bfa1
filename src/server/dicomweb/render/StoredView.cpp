#include "server/dicomweb/render/StoredView.h"

#include "server/dicomweb/MediaTypes.h"
#include "server/dicomweb/retrieve/PixelValue.h"
#include "server/dicomweb/retrieve/ValueAnswer.h"
#include "server/http/AcceptHeader.h"

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcxfer.h>
#include <kddlib/OwnAttributes.h>
#include <kddlib/TagElement.h>
#include <kddlib/TagMap.h>

namespace Kdd::DicomWeb
{
namespace
{

struct Kind
{
    bool isDocument = false;
    QByteArray videoType;  // empty for what is no video
};

Kind kindOf(const ServedStudy& study, const ListedImage& image)
{
    Kind kind;
    study.look([&](const TagFile& file) {
        const TagMap* map = file.findImage(image.key);
        if (map == nullptr)
            return;
        kind.isDocument = map->findElement(DCM_EncapsulatedDocument) != nullptr;
        const TagElement* syntax = map->findElement(kTransferSyntax);
        if (syntax == nullptr || syntax->value().size() != 1)
            return;
        const QByteArray uid = DcmXfer(static_cast<E_TransferSyntax>(syntax->value().at(0))).getXferID();
        if (isVideo(uid))
            kind.videoType = mediaTypeOf(uid);
    });
    return kind;
}

Http::Response answerDocument(const Http::Request& request, const ServedStudy& study,
                              const ListedImage& image, ObjectShelf& objects)
{
    BulkValue value;
    const Verdict found = findBulkValue(study, image, {{DCM_EncapsulatedDocument, 0}}, objects, value);
    if (found.bad())
        return found.response();
    if (Http::AcceptHeader::of(request).quality({value.mediaType, {}}) == 0)
        return Http::failure(406, QStringLiteral("The document is given as ") +
                                      QString::fromLatin1(value.mediaType));
    return answerAlone(request, value, value.mediaType);
}

Http::Response answerVideo(const Http::Request& request, const ServedStudy& study, const ListedImage& image,
                           ObjectShelf& objects, const QByteArray& mediaType)
{
    ImageOrigin origin;
    FoundObject object;
    BulkValue value;
    Verdict verdict = takeImage(study, image.key, origin, nullptr);
    if (verdict.good())
        verdict = objects.open(origin, object);
    if (verdict.good() && !isOneValue(object.index))
        verdict = {406, QStringLiteral("The video is not one stream")};
    if (verdict.good())
        verdict = storedPixels(object, value);
    return verdict.good() ? answerAlone(request, value, mediaType) : verdict.response();
}

}  // namespace

std::optional<Http::Response> answerAsStored(const Http::Request& request, const ServedStudy& study,
                                             const ListedImage& image, ObjectShelf& objects)
{
    const Kind kind = kindOf(study, image);
    if (kind.isDocument)
        return answerDocument(request, study, image, objects);
    if (kind.videoType.isEmpty())
        return std::nullopt;
    const QVector<Http::MediaType> offers = {
        {kind.videoType, {}}, {"image/jpeg", {}}, {"image/png", {}}, {"multipart/related", "image/jpeg"}};
    if (Http::AcceptHeader::of(request).choose(offers) != 0)
        return std::nullopt;
    return answerVideo(request, study, image, objects, kind.videoType);
}

}  // namespace Kdd::DicomWeb
