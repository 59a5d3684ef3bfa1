#include "server/dicomweb/uri/UriResource.h"

#include "server/dicomweb/render/WholeValue.h"
#include "server/dicomweb/retrieve/ImageFinder.h"
#include "server/dicomweb/uri/UriRequest.h"

#include <QByteArrayList>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <kddlib/TagMap.h>

namespace Kdd::DicomWeb
{

namespace
{

const QByteArray kDicom("application/dicom");

/// What an instance can be given as, the first by default: a picture where it is one, a report in words, else the object.
Verdict offersFor(const ServedStudy& study, const UriRequest& wanted, QVector<Http::MediaType>& offers)
{
    return study.look([&](const TagFile& file) -> Verdict {
        const TagMap* image = findImage(file, wanted.path);
        if (image == nullptr)
            return {404, QStringLiteral("There is no such instance in that series")};
        const bool isImage = image->findElement(DCM_Rows) != nullptr;
        QByteArray frames;
        image->findAndGetString(DCM_NumberOfFrames, frames);
        const bool isPicture = isImage && (frames.toInt() <= 1 || !wanted.frame.isEmpty());
        if (isPicture)
            offers = {{"image/jpeg", {}}, {"image/png", {}}, {kDicom, {}}};
        else if (isImage)
            offers = {{kDicom, {}}, {"image/jpeg", {}}, {"image/png", {}}};
        else if (isReport(*image))
            offers = {{"text/html", {}}, {"text/plain", {}}, {kDicom, {}}};
        else
            offers = {{kDicom, {}}, {"application/pdf", {}}};
        for (const char* video : {"video/mp4", "video/mpeg", "video/mp2t"}) {
            if (isImage)
                offers.append(Http::MediaType{video, {}});
        }
        return {};
    });
}

}  // namespace

bool UriResource::owns(const ResourcePath& path) const
{
    return path.resource == "wado" && path.study.isEmpty() && path.rest.isEmpty();
}

Http::Response UriResource::answer(const Http::Request& request, const ResourcePath& /*path*/)
{
    UriRequest wanted;
    std::shared_ptr<const ServedStudy> study;
    QVector<Http::MediaType> offers;
    Verdict verdict = UriRequest::parse(request, wanted);
    if (verdict.good())
        verdict = findStudy(*mStudies, wanted.path, study);
    if (verdict.good())
        verdict = offersFor(*study, wanted, offers);
    if (verdict.bad())
        return verdict.response();
    const int chosen = wanted.accept.choose(offers);
    if (chosen < 0) {
        QByteArrayList names;
        for (const Http::MediaType& offer : qAsConst(offers))
            names.append(offer.name);
        return Http::failure(406, QStringLiteral("The instance can be asked for as ") +
                                      QString::fromLatin1(names.join(", ")));
    }
    if (offers[chosen].name == kDicom)
        return asObject(request, wanted);
    if (!wanted.notDone.isEmpty())
        return Http::failure(400, QStringLiteral("Pictures are drawn without what the parameter %1 asks for")
                                      .arg(QString::fromLatin1(wanted.notDone)));
    wanted.path.resource = "rendered";
    if (!wanted.frame.isEmpty()) {
        wanted.path.resource = "frames";
        wanted.path.rest = {wanted.frame, "rendered"};
    }
    return mRendered.show(request, Http::AcceptHeader(offers[chosen].name), wanted.rendering, wanted.path);
}

/// In the syntax that is asked for; where that cannot be, or none is, without compression; and as stored where there is
/// no decoder.
Http::Response UriResource::asObject(const Http::Request& request, const UriRequest& wanted)
{
    QByteArray accept = kDicom + ";q=0.5," + kDicom + ";transfer-syntax=*;q=0.1";
    if (!wanted.transferSyntax.isEmpty())
        accept += ',' + kDicom + ";transfer-syntax=" + wanted.transferSyntax;
    Http::Request made = request;
    made.query = {{"accept", accept}};
    return mInstances.answer(made, wanted.path);
}

}  // namespace Kdd::DicomWeb
