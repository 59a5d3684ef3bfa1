#pragma once

#include "server/dicomweb/Resource.h"
#include "server/dicomweb/StudyShelf.h"
#include "server/dicomweb/retrieve/ObjectShelf.h"
#include "server/dicomweb/search/ThreadSearch.h"

#include <kddlib/Kxg.h>

#include <memory>
#include <vector>

namespace Kdd
{

/// What the server keeps of the archive between requests.
struct ServedArchive
{
    DicomWeb::StudyShelf studies{64 * 1024 * 1024};
    DicomWeb::ObjectShelf objects{16 * 1024 * 1024};
    DicomWeb::ThreadSearch database{Kxg::DatabaseServer()};
};

/// All that answers below the prefix of DICOMweb, in the order in which they are asked whether a path is theirs. The
/// archive outlives them.
std::vector<std::unique_ptr<DicomWeb::Resource>> makeResources(ServedArchive& archive);

}  // namespace Kdd
