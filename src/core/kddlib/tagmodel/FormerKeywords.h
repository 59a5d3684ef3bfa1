#pragma once

#include <QByteArray>

namespace Kdd
{

/// The present keyword of an attribute that an earlier data dictionary knew by `formerKeyword`; null when the keyword
/// is no former one. Two attributes were deleted and answer "(deleted)", which no dictionary knows.
const char* currentKeyword(const QByteArray& formerKeyword);

}  // namespace Kdd
