#pragma once

#include <QByteArray>
#include <QMap>

namespace Kxg
{

class SqlConnection;

// What every transaction that changes a study needs. Call within one; failures throw DatabaseError.

/// The id of a study, 0 when it is not there.
qint64 findStudyId(SqlConnection& connection, const QByteArray& studyUID);

/// Likewise; throws when it is not there.
qint64 obtainStudyId(SqlConnection& connection, const QByteArray& studyUID);

/// To be called once for each study touched, after everything else: removes its series that have become empty, and the
/// study itself when nothing is left of it. Else leaves a request to build it and enters that by the study's UID.
void concludeChange(SqlConnection& connection, qint64 studyId, QMap<QByteArray, qint64>& requests);

/// Leaves a request to build the study; 0 when there is no such study.
qint64 leaveRequest(SqlConnection& connection, qint64 studyId);

}  // namespace Kxg
