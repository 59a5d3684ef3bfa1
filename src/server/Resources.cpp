#include "server/Resources.h"

#include "server/dicomweb/metadata/MetadataResource.h"
#include "server/dicomweb/render/RenderedResource.h"
#include "server/dicomweb/render/ThumbnailResource.h"
#include "server/dicomweb/retrieve/BulkDataResource.h"
#include "server/dicomweb/retrieve/FramesResource.h"
#include "server/dicomweb/retrieve/InstancesResource.h"
#include "server/dicomweb/search/ChangeFeed.h"
#include "server/dicomweb/search/SearchResource.h"
#include "server/dicomweb/store/StoreResource.h"

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

std::vector<std::unique_ptr<DicomWeb::Resource>> makeResources(ServedArchive& archive)
{
    using namespace DicomWeb;

    std::vector<std::unique_ptr<Resource>> resources;
    // Viewers ask for frames nine times of ten.
    resources.push_back(std::make_unique<FramesResource>(archive.studies, archive.objects));
    resources.push_back(std::make_unique<MetadataResource>(*archive.studies, answersFolder(),
                                                           qint64(ExResource::answersSize()) * 1024 * 1024));
    resources.push_back(std::make_unique<SearchResource>(archive.database, *archive.studies));
    resources.push_back(std::make_unique<ChangeFeed>(archive.database));
    resources.push_back(std::make_unique<InstancesResource>(archive.studies, archive.objects));
    resources.push_back(std::make_unique<BulkDataResource>(archive.studies, archive.objects));
    resources.push_back(std::make_unique<ThumbnailResource>(*archive.studies));
    resources.push_back(std::make_unique<RenderedResource>(*archive.studies));
    if (archive.arrivals != nullptr)
        resources.push_back(std::make_unique<StoreResource>(*archive.arrivals, archive.storeLimits));
    return resources;
}

}  // namespace Kdd
