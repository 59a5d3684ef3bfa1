#include "server/Resources.h"

#include "server/dicomweb/change/CorrectionsResource.h"
#include "server/dicomweb/change/RemovalResource.h"
#include "server/dicomweb/metadata/MetadataResource.h"
#include "server/dicomweb/render/RenderedResource.h"
#include "server/dicomweb/render/ThumbnailResource.h"
#include "server/dicomweb/retrieve/BulkDataResource.h"
#include "server/dicomweb/retrieve/FramesResource.h"
#include "server/dicomweb/retrieve/InstancesResource.h"
#include "server/dicomweb/search/ChangeFeed.h"
#include "server/dicomweb/search/SearchResource.h"
#include "server/dicomweb/store/StoreResource.h"
#include "server/dicomweb/uri/UriResource.h"

#include <kddlib/ExResource.h>
#include <kddlib/PathName.h>
#include <kddlib/TagFile.h>

namespace Kdd
{
namespace
{

QString answersFolder()
{
    const QByteArray configured = ExResource::answersFolder();
    return pathText(configured.isEmpty() ? TagFile::metaFolder() + QByteArray("answers") : configured);
}

}  // namespace

std::vector<std::unique_ptr<DicomWeb::Resource>> makeResources(ServedArchive& archive, Http::Metrics& metrics)
{
    using namespace DicomWeb;

    std::vector<std::unique_ptr<Resource>> resources;
    // Viewers ask for frames nine times of ten.
    resources.push_back(std::make_unique<FramesResource>(archive.studies, archive.objects));
    auto metadata = std::make_unique<MetadataResource>(*archive.studies, answersFolder(),
                                                       qint64(ExResource::answersSize()) * 1024 * 1024);
    metrics.addCache("studies", archive.studies->count());
    metrics.addCache("objects", archive.objects->count());
    metrics.addCache("answers", metadata->keptCount());
    resources.push_back(std::move(metadata));
    resources.push_back(std::make_unique<SearchResource>(archive.database, *archive.studies));
    resources.push_back(std::make_unique<ChangeFeed>(archive.database));
    resources.push_back(std::make_unique<InstancesResource>(archive.studies, archive.objects));
    resources.push_back(std::make_unique<BulkDataResource>(archive.studies, archive.objects));
    resources.push_back(std::make_unique<ThumbnailResource>(archive.studies, archive.objects));
    resources.push_back(std::make_unique<RenderedResource>(archive.studies, archive.objects));
    resources.push_back(std::make_unique<UriResource>(archive.studies, archive.objects));
    if (archive.arrivals != nullptr && archive.takesByRequest)
        resources.push_back(
            std::make_unique<StoreResource>(*archive.arrivals, archive.sight, archive.storeLimits));
    resources.push_back(
        std::make_unique<CorrectionsResource>(*archive.studies, archive.sight, *archive.changes));
    resources.push_back(
        std::make_unique<RemovalResource>(*archive.studies, archive.catalogue, *archive.changes));
    return resources;
}

std::vector<std::unique_ptr<DicomWeb::Resource>> makeUriResources(ServedArchive& archive)
{
    std::vector<std::unique_ptr<DicomWeb::Resource>> resources;
    resources.push_back(std::make_unique<DicomWeb::UriResource>(archive.studies, archive.objects));
    return resources;
}

}  // namespace Kdd
