#pragma once

#include "platform/database/Catalogue.h"

namespace Kdd
{

class TagFile;

/// Builds the whole tag file of the study claimed from all its files and takes it off the queue. False, with the reason
/// logged, when it could not be written; the study then goes on waiting.
bool buildStudy(Kxg::StudyClaim& claim, bool optimize, TagFile& file);

/// The same without loading again the files whose images `loaded` holds.
bool buildStudy(Kxg::StudyClaim& claim, bool optimize, TagFile& file, const TagFile& loaded);

/// Claims a study, waiting a good while for whoever works on it. Null, with the reason logged, when it stays claimed.
std::unique_ptr<Kxg::StudyClaim> claimStudy(Kxg::Catalogue& database, const QByteArray& studyUID);

}  // namespace Kdd
