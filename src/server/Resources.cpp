#include "server/Resources.h"

#include "server/dicomweb/retrieve/BulkDataResource.h"
#include "server/dicomweb/retrieve/FramesResource.h"
#include "server/dicomweb/retrieve/InstancesResource.h"

namespace Kdd
{

namespace
{

// Per process [bytes]. A study of 1,000 images takes about 4 MiB, where the frames of an image lie about 300 bytes.
constexpr qint64 kStudies = qint64(64) * 1024 * 1024;
constexpr int kObjects = 32 * 1024 * 1024;

}  // namespace

std::vector<std::unique_ptr<DicomWeb::Resource>> makeResources()
{
    const auto studies = std::make_shared<DicomWeb::StudyShelf>(kStudies);
    const auto objects = std::make_shared<DicomWeb::ObjectShelf>(kObjects);
    std::vector<std::unique_ptr<DicomWeb::Resource>> resources;
    resources.push_back(std::make_unique<DicomWeb::FramesResource>(studies, objects));
    resources.push_back(std::make_unique<DicomWeb::InstancesResource>(studies, objects));
    resources.push_back(std::make_unique<DicomWeb::BulkDataResource>(studies, objects));
    return resources;
}

}  // namespace Kdd
