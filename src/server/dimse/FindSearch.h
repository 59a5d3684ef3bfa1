#pragma once

#include "server/dicomweb/StudyShelf.h"
#include "server/dicomweb/search/ThreadSearch.h"
#include "server/dimse/QueryEnding.h"

#include <vector>

namespace Kdd::DicomWeb
{
struct SearchRequest;
}

namespace Kdd::Dimse
{

/// Who asks may see these studies; null: all.
using StudyLimits = std::shared_ptr<const Kxg::StudyLimits>;

/// Puts what is found into `found`, each an object of the DICOM JSON model, `search.limit` at most. After a failure that is
/// what could be found all the same; there may be more of it.
QueryEnding findObjects(const DicomWeb::SearchRequest& search, const StudyLimits& limits,
                        const DicomWeb::ThreadSearch& database, DicomWeb::StudyShelf& shelf,
                        std::vector<QByteArray>& found);

}  // namespace Kdd::Dimse
