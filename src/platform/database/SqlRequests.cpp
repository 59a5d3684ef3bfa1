#include "platform/database/SqlCatalogue.h"
#include "platform/database/StudyContent.h"

// The queue of studies that are to be built, without the claims of those who build them.

namespace Kxg
{

Kdd::Result SqlCatalogue::requestBuild(const QVector<QByteArray>& studyUIDs, IfGone ifGone)
{
    return transact(Access::Write, [&] {
        // An absent study has the id 0, for which no request is left.
        for (const QByteArray& uid : studyUIDs)
            leaveRequest(mConnection, ifGone == IfGone::PassOver ? findStudyId(mConnection, uid)
                                                                 : obtainStudyId(mConnection, uid));
    });
}

Kdd::Result SqlCatalogue::settleNow()
{
    return transact(Access::Write, [&] {
        if (mConnection.change("UPDATE build_request SET due = 0 WHERE due > 0") > 0)
            tellOfWork(mConnection);
    });
}

Kdd::Result SqlCatalogue::countWaiting(int& studies)
{
    return transact(Access::Read, [&] {
        SqlRows rows = mConnection.ask("SELECT COUNT(DISTINCT study_id) FROM build_request WHERE due <= ?",
                                       {presentMs()});
        if (rows.next())
            studies = static_cast<int>(rows.number(0));
    });
}

Kdd::Result SqlCatalogue::additions(const QByteArray& studyUID, QVector<qint64>& requests)
{
    return transact(Access::Read, [&] {
        QVector<qint64> found;
        SqlRows rows = mConnection.ask("SELECT build_request.id FROM build_request JOIN study"
                                       " ON study.id = build_request.study_id"
                                       " WHERE study.uid = ? AND adds = 1 ORDER BY build_request.id",
                                       {textValue(studyUID)});
        while (rows.next())
            found.push_back(rows.number(0));
        requests.swap(found);
    });
}

/// From the requests, of which there are few, to the files: those of a study that was corrected may lie in another one's folder.
Kdd::Result SqlCatalogue::awaitsObjects(const QByteArray& studyUID, const QByteArray& folder, bool& awaits)
{
    return transact(Access::Read, [&] {
        SqlRows rows =
            mConnection.ask("SELECT 1 FROM study WHERE uid = ? AND EXISTS (SELECT 1 FROM build_request"
                            " WHERE build_request.study_id = study.id AND due = 0 AND adds >= 0)"
                            " AND EXISTS (SELECT 1 FROM series JOIN file ON file.series_id = series.id"
                            " WHERE series.study_id = study.id AND file.path >= ? AND file.path < ?)",
                            {textValue(studyUID), bytesValue(folder + '/'), bytesValue(folder + '0')});
        awaits = rows.next();
    });
}

Kdd::Result SqlCatalogue::finishRequests(const QVector<qint64>& requests)
{
    return transact(Access::Write, [&] { deleteRequests(mConnection, requests); });
}

}  // namespace Kxg
