#include "platform/database/StudyContent.h"

#include "platform/database/SearchRows.h"
#include "platform/database/SqlConnection.h"
#include "platform/database/SqlDialect.h"

#include <QDateTime>

namespace Kxg
{
namespace
{

KeptNode obtain(SqlConnection& connection, const char* search, const char* make, const QVariantList& key)
{
    // The answer goes before the next statement runs, as rows come from the engine one by one.
    {
        SqlRows found = connection.ask(search, key);
        if (found.next())
            return {found.number(0), found.number(1) != 0};
    }
    // Nobody has made it in between, because writers take turns.
    SqlRows made = connection.ask(make, key);
    return {made.next() ? made.number(0) : 0, false};
}

}  // namespace

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

KeptNode obtainStudy(SqlConnection& connection, const QByteArray& studyUID)
{
    return obtain(connection, "SELECT id, is_described FROM study WHERE uid = ?",
                  "INSERT INTO study (uid) VALUES (?) RETURNING id", {textValue(studyUID)});
}

KeptNode obtainSeries(SqlConnection& connection, qint64 studyId, const QByteArray& seriesUID)
{
    return obtain(connection, "SELECT id, is_described FROM series WHERE study_id = ? AND uid = ?",
                  "INSERT INTO series (study_id, uid) VALUES (?, ?) RETURNING id",
                  {studyId, textValue(seriesUID)});
}

qint64 leaveRequest(SqlConnection& connection, qint64 studyId, qint64 due, Reason reason)
{
    const bool isAddition = reason == Reason::Added;
    qint64 request = 0;
    {
        // Selected from the table, so that a study that is gone gets no request.
        SqlRows rows = connection.ask("INSERT INTO build_request (study_id, due, adds, since)"
                                      " SELECT id, CAST(? AS BIGINT), CAST(? AS SMALLINT), CAST(? AS BIGINT)"
                                      " FROM study WHERE id = ? RETURNING id",
                                      {due, isAddition ? 1 : 0, presentMs(), studyId});
        request = rows.next() ? rows.number(0) : 0;
    }
    if (request != 0 && due == 0 && !isAddition)
        tellOfWork(connection);
    return request;
}

void deleteRequests(SqlConnection& connection, const QVector<qint64>& requests)
{
    for (const qint64 request : requests)
        connection.change("DELETE FROM build_request WHERE id = ?", {request});
}

void tellOfWork(SqlConnection& connection)
{
    const QString& tell = SqlDialect::of(connection.address().engine).tellOfWork;
    if (!tell.isEmpty())
        connection.execute(tell);
}

void concludeChange(SqlConnection& connection, qint64 studyId, QMap<QByteArray, qint64>& requests,
                    Reason reason)
{
    // Before the request is left, so that whoever reads the study for it finds no series without files.
    connection.change("DELETE FROM series WHERE study_id = ?"
                      " AND NOT EXISTS (SELECT 1 FROM file WHERE file.series_id = series.id)",
                      {studyId});
    putRegisteredRows(connection, studyId);
    const qint64 request = leaveRequest(connection, studyId, 0, reason);
    SqlRows rows = connection.ask("SELECT uid FROM study WHERE id = ?", {studyId});
    if (rows.next())
        requests.insert(rows.text(0), request);
}

qint64 takeRegistrationNumbers(SqlConnection& connection, qint64 count)
{
    // Counted apart from the files, so that removing the newest file does not bring its number back.
    SqlRows rows = connection.ask("UPDATE registration SET last = last + ? RETURNING last", {count});
    return rows.next() ? rows.number(0) - count + 1 : 0;
}

void showNewest(SqlConnection& connection, qint64 studyId, const QByteArray& sopUID)
{
    // Files may share a number when they were registered before numbers were kept; then the last path counts.
    connection.change("UPDATE file SET is_shown = 1 WHERE path ="
                      " (SELECT newest.path FROM file newest JOIN series ON series.id = newest.series_id"
                      " WHERE series.study_id = ? AND newest.sop_uid = ? AND newest.kind = 1"
                      " ORDER BY newest.registered DESC, newest.path DESC LIMIT 1)",
                      {studyId, textValue(sopUID)});
}

void showNewestOfAll(SqlConnection& connection, qint64 studyId)
{
    QList<QByteArray> images;
    {
        // Only an image with a file that is not shown can have one to take the place of another.
        SqlRows rows =
            connection.ask("SELECT DISTINCT file.sop_uid FROM file JOIN series ON series.id = file.series_id"
                           " WHERE series.study_id = ? AND file.kind = 1 AND file.is_shown = 0",
                           {studyId});
        while (rows.next())
            images.append(rows.text(0));
    }
    for (const QByteArray& image : qAsConst(images))
        showNewest(connection, studyId, image);
}

qint64 presentMs()
{
    return QDateTime::currentMSecsSinceEpoch();
}

}  // namespace Kxg
