#pragma once

#include "platform/base/Export.h"
#include "platform/database/Catalogue.h"

#include <memory>

namespace Kdd
{

// The archive's own use of the image database that `Kxg::SetDatabaseServer` names.

/// A connection of the calling thread. Null, with the reason logged, when it cannot be had.
KDD_EXPORT std::unique_ptr<Kxg::Catalogue> openCatalogue();

/// Whether the result is good; a failure is logged.
KDD_EXPORT bool succeeded(const Result& result);

/// Claims a study, waiting some minutes for whoever works on it. Null, with the reason logged, when it stays claimed.
KDD_EXPORT std::unique_ptr<Kxg::StudyClaim> claimStudy(Kxg::Catalogue& catalogue, const QByteArray& studyUID);

}  // namespace Kdd
