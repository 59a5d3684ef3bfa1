#pragma once

#include "platform/base/Export.h"
#include "platform/database/Catalogue.h"

#include <memory>

namespace Kdd
{

// The archive's own use of the image database that `Kxg::SetDatabaseServer` names.
//
// What the archive does answers with a Result; who asked for it logs the failure. Of work on many files or studies, of
// which some may fail, each failure is logged where it happens, and the answer is a total.

/// A connection of the calling thread. Null, with the reason logged, when it cannot be had.
KDD_EXPORT std::unique_ptr<Kxg::Catalogue> openCatalogue();

/// Whether the result is good; a failure is logged.
KDD_EXPORT bool succeeded(const Result& result);

/// Claims a study, waiting some minutes for whoever works on it; that it stays claimed is a failure.
KDD_EXPORT Result claimStudy(Kxg::Catalogue& catalogue, const QByteArray& studyUID,
                             std::unique_ptr<Kxg::StudyClaim>& claim);

}  // namespace Kdd
