#include "server/Resources.h"

namespace Kdd
{

std::vector<std::unique_ptr<DicomWeb::Resource>> makeResources()
{
    std::vector<std::unique_ptr<DicomWeb::Resource>> resources;
    return resources;
}

}  // namespace Kdd
