#pragma once

#include "platform/database/TagFileStamp.h"

namespace Kxg
{

class SqlConnection;

/// To be called before the study's tag file is kept as `next`, or as none: adds the one that was written last so far to the
/// former ones, unless it is the same, and forgets the oldest of too many. Within a transaction; throws DatabaseError.
void keepFormerTagFile(SqlConnection& connection, qint64 studyId, const TagFileStamp& next);

}  // namespace Kxg
