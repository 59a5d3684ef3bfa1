#pragma once

#include "platform/database/TagFileStamp.h"

#include <QByteArray>

namespace Kxg
{

class SqlConnection;
struct TagFileProofs;

/// To be called before the study's tag file is kept as `next`, or as none: adds the one that was written last so far to the
/// former ones, unless it is the same, and forgets the oldest of too many. Within a transaction; throws DatabaseError.
void keepFormerTagFile(SqlConnection& connection, qint64 studyId, const TagFileStamp& next);

/// What is known of the study's tag file, but for the former ones. The study's number; 0: there is none.
qint64 readTagFileProofs(SqlConnection& connection, const QByteArray& studyUID, TagFileProofs& proofs);

}  // namespace Kxg
