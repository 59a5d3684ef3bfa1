#include "platform/database/StudyContent.h"

#include "platform/database/SqlConnection.h"

namespace Kxg
{

qint64 findStudyId(SqlConnection& connection, const QByteArray& studyUID)
{
    SqlRows rows = connection.ask("SELECT id FROM study WHERE uid = ?", {textValue(studyUID)});
    return rows.next() ? rows.number(0) : 0;
}

qint64 obtainStudyId(SqlConnection& connection, const QByteArray& studyUID)
{
    const qint64 id = findStudyId(connection, studyUID);
    if (id == 0)
        throw DatabaseError(QStringLiteral("there is no study %1").arg(QString::fromUtf8(studyUID)));
    return id;
}

qint64 leaveRequest(SqlConnection& connection, qint64 studyId)
{
    SqlRows rows = connection.ask(
        "INSERT INTO build_request (study_id) SELECT id FROM study WHERE id = ? RETURNING id", {studyId});
    return rows.next() ? rows.number(0) : 0;
}

void concludeChange(SqlConnection& connection, qint64 studyId, QMap<QByteArray, qint64>& requests)
{
    connection.change("DELETE FROM series WHERE study_id = ?"
                      " AND NOT EXISTS (SELECT 1 FROM file WHERE file.series_id = series.id)",
                      {studyId});
    connection.change("DELETE FROM study WHERE id = ?"
                      " AND NOT EXISTS (SELECT 1 FROM series WHERE series.study_id = study.id)",
                      {studyId});
    const qint64 request = leaveRequest(connection, studyId);
    if (request == 0)
        return;
    SqlRows rows = connection.ask("SELECT uid FROM study WHERE id = ?", {studyId});
    if (rows.next())
        requests.insert(rows.text(0), request);
}

}  // namespace Kxg
