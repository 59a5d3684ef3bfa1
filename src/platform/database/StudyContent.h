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

/// A study or series as it is kept.
struct KeptNode
{
    qint64 id = 0;
    bool isDescribed = false;
};

/// A study or series, which is made when it is not there.
KeptNode obtainStudy(SqlConnection& connection, const QByteArray& studyUID);
KeptNode obtainSeries(SqlConnection& connection, qint64 studyId, const QByteArray& seriesUID);

/// Why a study is to be built.
enum class Reason {
    Changed,
    Added,  ///< nothing happened but that files came that were not known before
};

/// To be called once for each study touched, after everything else: removes its series that have become empty, leaves a
/// request to build it and enters that by the study's UID. The study itself stays, also without files: whoever builds it
/// then removes its tag file.
void concludeChange(SqlConnection& connection, qint64 studyId, QMap<QByteArray, qint64>& requests,
                    Reason reason = Reason::Changed);

/// Leaves a request to build the study that counts from `due` on [ms since the epoch]; 0 when there is no such study.
/// Workers are told of one that counts at once, but for what was only added: whoever took that in completes the study.
qint64 leaveRequest(SqlConnection& connection, qint64 studyId, qint64 due = 0,
                    Reason reason = Reason::Changed);

/// Takes requests off the queue that are done.
void deleteRequests(SqlConnection& connection, const QVector<qint64>& requests);

/// Wakes those who wait for work, when the transaction comes to its end; nobody where the engine cannot.
void tellOfWork(SqlConnection& connection);

/// So many numbers of registration; the first of them.
qint64 takeRegistrationNumbers(SqlConnection& connection, qint64 count);

/// Shows of the files of one image in a study the one registered last, once the one that was shown is gone.
void showNewest(SqlConnection& connection, qint64 studyId, const QByteArray& sopUID);

/// The same for every image of the study.
void showNewestOfAll(SqlConnection& connection, qint64 studyId);

/// The present moment, against which requests are held [ms since the epoch].
qint64 presentMs();

}  // namespace Kxg
