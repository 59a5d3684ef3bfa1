#pragma once

#include "server/dicomweb/Resource.h"
#include "server/dicomweb/StudyShelf.h"
#include "server/dicomweb/change/Turns.h"
#include "server/dicomweb/retrieve/ObjectShelf.h"
#include "server/dicomweb/search/StudySight.h"
#include "server/dicomweb/store/StoreBody.h"
#include "server/http/Metrics.h"

#include <kddlib/Kxg.h>

#include <memory>
#include <vector>

namespace Kdd
{

/// What the server keeps of the archive between requests.
struct ServedArchive
{
    // A study of 1,000 images takes about 4 MiB, where the frames of an image lie about 300 bytes.
    std::shared_ptr<DicomWeb::StudyShelf> studies = std::make_shared<DicomWeb::StudyShelf>(qint64(64) << 20);
    std::shared_ptr<DicomWeb::ObjectShelf> objects = std::make_shared<DicomWeb::ObjectShelf>(32 << 20);
    DicomWeb::ThreadSearch database{Kxg::DatabaseServer()};
    DicomWeb::StudySight sight{database, *studies};
    std::unique_ptr<DicomWeb::TagFileWitness> witness;   ///< null where tag files are believed
    std::unique_ptr<DicomWeb::ArrivalService> arrivals;  ///< null where no objects are taken
    bool takesByRequest = true;                          ///< and not by associations alone
    DicomWeb::StoreLimits storeLimits;
    DicomWeb::ThreadCatalogue catalogue{Kxg::DatabaseServer()};  ///< for who removes something
    std::unique_ptr<DicomWeb::Turns> changes;                    ///< of those who correct or remove
};

/// All that answers below the prefix of DICOMweb, in the order in which they are asked whether a path is theirs. The
/// archive outlives them, and `metrics`, which is told of what is kept ready, is asked for nothing once they are gone.
std::vector<std::unique_ptr<DicomWeb::Resource>> makeResources(ServedArchive& archive,
                                                               Http::Metrics& metrics);

/// What answers beside that prefix, under the one path that older viewers know.
std::vector<std::unique_ptr<DicomWeb::Resource>> makeUriResources(ServedArchive& archive);

}  // namespace Kdd
