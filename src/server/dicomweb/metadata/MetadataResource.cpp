#include "server/dicomweb/metadata/MetadataResource.h"

#include "server/dicomweb/metadata/MetadataAnswer.h"
#include "server/dicomweb/metadata/MetadataText.h"
#include "server/http/EntityTag.h"

namespace Kdd::DicomWeb
{
namespace
{

/// Under which an answer is kept, and by which clients know it.
QByteArray nameOf(const MetadataRequest& metadata, const QByteArray& version)
{
    return version + '-' + metadata.digest();
}

/// Compressed bytes are other bytes.
QByteArray entityTag(const MetadataRequest& metadata, const QByteArray& version)
{
    return '"' + nameOf(metadata, version) + (metadata.takesGzip ? "-gzip\"" : "\"");
}

const QByteArray kVary = "Accept, Accept-Encoding";

Http::Response found(const QByteArray& tag, const MetadataRequest& metadata)
{
    Http::Response response;
    Http::addEntityTag(tag, response, kVary);
    response.addHeader("Content-Type", metadata.contentType());
    if (metadata.takesGzip)
        response.addHeader("Content-Encoding", "gzip");
    return response;
}

}  // namespace

bool MetadataResource::owns(const ResourcePath& path) const
{
    return path.resource == "metadata" && !path.study.isEmpty() && path.rest.isEmpty();
}

Http::Response MetadataResource::answer(const Http::Request& request, const ResourcePath& path)
{
    MetadataRequest metadata;
    int status = 0;
    QString reason;
    if (!metadata.read(request, path, status, reason))
        return Http::failure(status, reason);

    Arrivals* const arrivals = mStudies.arrivals();
    if (arrivals != nullptr)
        arrivals->bringInOwn(path.study);
    Http::Response response;
    Presence presence = Presence::Absent;
    const auto isThere = [&] {
        response = look(request, metadata, presence);
        // A tag file that is no good may be made anew with what has arrived.
        return presence == Presence::Held || (presence == Presence::Found && response.status != 404);
    };
    return isLackingAfter(isThere, path.study, arrivals) ? verdictOn(Presence::Held).response()
                                                         : std::move(response);
}

Http::Response MetadataResource::look(const Http::Request& request, const MetadataRequest& metadata,
                                      Presence& presence)
{
    // The version alone answers whoever has the answer already or gets one that is kept: both exist only of what was
    // there in this version.
    QByteArray version;
    std::shared_ptr<const ServedStudy> study;
    presence = mStudies.version(metadata.path.study, version, study);
    if (presence != Presence::Found)
        return verdictOn(presence).response();
    const QByteArray tag = entityTag(metadata, version);
    if (Http::hasEntity(request, tag, Http::AnyTag::DoesNotCount))
        return Http::notModified(tag, kVary);
    Http::FileRange kept;
    if (metadata.takesGzip && metadata.path.instance.isEmpty() &&
        mKept.find(nameOf(metadata, version), kept)) {
        Http::Response response = found(tag, metadata);
        response.body.emplace_back(std::move(kept));
        return response;
    }
    if (study == nullptr)
        presence = mStudies.find(metadata.path.study, study);
    return presence == Presence::Found ? answerFrom(std::move(study), request, metadata)
                                       : verdictOn(presence).response();
}

Http::Response MetadataResource::answerFrom(std::shared_ptr<const ServedStudy> study,
                                            const Http::Request& request, const MetadataRequest& metadata)
{
    // Of this state, which may be a later one than was asked about first.
    const QByteArray version = study->version();
    const QByteArray tag = entityTag(metadata, version);
    auto text = std::make_unique<MetadataText>(std::move(study), metadata);
    if (text->count() == 0)
        return Http::failure(404, metadata.path.instance.isEmpty() ? QStringLiteral("No such series")
                                                                   : QStringLiteral("No such instance"));
    if (Http::hasEntity(request, tag))
        return Http::notModified(tag, kVary);
    Http::Response response = found(tag, metadata);
    addBody(response, std::move(text), metadata.takesGzip, mKept, nameOf(metadata, version));
    return response;
}

}  // namespace Kdd::DicomWeb
