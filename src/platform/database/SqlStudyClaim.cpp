#include "platform/database/ChangeLog.h"
#include "platform/database/ProofRows.h"
#include "platform/database/SearchRows.h"
#include "platform/database/SqlCatalogue.h"
#include "platform/database/StudyContent.h"
#include "platform/database/StudyDescription.h"
#include "platform/database/StudyLock.h"

#include <QElapsedTimer>
#include <QThread>

#include <limits>
#include <utility>

namespace Kxg
{
namespace
{

// Mostly the first request is free, but where many builders work the first dozens are taken.
constexpr int kPageOfQueue = 64;      // [requests]
constexpr unsigned long kPause = 20;  // [ms]

QVector<qint64> requestsOf(SqlConnection& connection, qint64 studyId)
{
    QVector<qint64> requests;
    SqlRows rows = connection.ask("SELECT id FROM build_request WHERE study_id = ? ORDER BY id", {studyId});
    while (rows.next())
        requests.push_back(rows.number(0));
    return requests;
}

/// A study as it is once it is locked.
struct LockedStudy
{
    bool isThere = false;
    QByteArray uid;
    QVector<qint64> requests;
};

LockedStudy readLocked(SqlConnection& connection, qint64 studyId)
{
    LockedStudy study;
    // A transaction begun after the study was locked sees all that its former holder and others have done.
    connection.transact(SqlConnection::Access::Read, [&] {
        study.requests = requestsOf(connection, studyId);
        SqlRows rows = connection.ask("SELECT uid FROM study WHERE id = ?", {studyId});
        study.isThere = rows.next();
        if (study.isThere)
            study.uid = rows.text(0);
    });
    return study;
}

/// A study that is locked, and the requests that were there after it was: whatever left them is seen by its builder.
class SqlStudyClaim : public StudyClaim
{
public:
    SqlStudyClaim(SqlConnection& connection, std::unique_ptr<StudyLock> lock, qint64 studyId,
                  LockedStudy study)
        : mConnection(connection)
        , mLock(std::move(lock))
        , mStudyId(studyId)
        , mStudy(std::move(study))
    {
    }

    int studyId() const override { return static_cast<int>(mStudyId); }
    const QByteArray& studyInstanceUID() const override { return mStudy.uid; }

    Kdd::Result noteRequests() override
    {
        return attempt(mConnection.address(), [this] {
            mConnection.transact(SqlConnection::Access::Read,
                                 [this] { mStudy.requests = requestsOf(mConnection, mStudyId); });
        });
    }

    Kdd::Result finish() override
    {
        return conclude(mStudy.requests, [] {});
    }

    Kdd::Result finish(const BuiltStudy& built) override
    {
        // A build that left something out keeps the requests, and with them the study's place in the queue.
        return conclude(built.isComplete ? mStudy.requests : QVector<qint64>(), [&] {
            keep(built);
            if (!built.isComplete)
                keepUnread();
            if (built.settleAt > 0)
                leaveRequest(mConnection, mStudyId, built.settleAt);
        });
    }

    Kdd::Result finishChange(const BuiltStudy& built, qint64 request) override
    {
        return conclude({request}, [&] {
            keep(built);
            keepWaiting();
        });
    }

    Kdd::Result noteSearch(const BuiltStudy& built) override
    {
        return conclude({}, [&] {
            keepSearch(built);
            keepWaiting();
        });
    }

    Kdd::Result finishRemoved() override
    {
        return conclude(mStudy.requests, [this] {
            if (searchRowOf(mConnection, mStudyId).isBuilt)
                noteChange(mConnection, {ChangeKind::Deleted, mStudy.uid, {}, {}, 0});
            removeSearchRows(mConnection, mStudyId);
            putRegisteredRows(mConnection, mStudyId);
            // Also for a study that stays because it got files meanwhile: it has no tag file now.
            keepFormerTagFile(mConnection, mStudyId, {});
            mConnection.change("UPDATE study SET tag_file_size = 0, tag_file_digest = NULL WHERE id = ?",
                               {mStudyId});
            // Requests that are still there came after those that are done, and speak of files.
            mConnection.change("DELETE FROM study WHERE id = ?"
                               " AND NOT EXISTS (SELECT 1 FROM series WHERE series.study_id = study.id)"
                               " AND NOT EXISTS (SELECT 1 FROM build_request"
                               " WHERE build_request.study_id = study.id)",
                               {mStudyId});
        });
    }

private:
    Kdd::Result conclude(const QVector<qint64>& done, const std::function<void()>& work)
    {
        return attempt(mConnection.address(), [&] {
            // A lock that was lost may be another builder's by now, whose work must not be overwritten.
            mLock->confirm();
            mConnection.transact(SqlConnection::Access::Write, [&] {
                // First, so that the work finds only requests that came since.
                deleteRequests(mConnection, done);
                work();
            });
        });
    }

    void keep(const BuiltStudy& built)
    {
        keepSearch(built);
        keepFormerTagFile(mConnection, mStudyId, built.tagFile);
        mConnection.change("UPDATE study SET tag_file_size = ?, tag_file_digest = ? WHERE id = ?",
                           {built.tagFile.size, bytesValue(built.tagFile.digest), mStudyId});
        describe(built.series);
    }

    /// The tag file may name files by now that nobody has read: for what is left to be done all of them are.
    void keepWaiting()
    {
        mConnection.change("UPDATE build_request SET adds = 0 WHERE study_id = ? AND adds = 1", {mStudyId});
    }

    /// Whoever looks at the study need not have this tried once more.
    void keepUnread()
    {
        keepWaiting();
        for (const qint64 request : qAsConst(mStudy.requests))
            mConnection.change("UPDATE build_request SET adds = -1 WHERE id = ?", {request});
    }

    void keepSearch(const BuiltStudy& built)
    {
        const SearchRowState row = searchRowOf(mConnection, mStudyId);
        int instances = 0;
        for (const SeriesSearchRecord& series : built.search.series)
            instances += series.instances;
        // A tag file without images is that of a study that goes on waiting for its first one.
        if (built.search.series.empty())
            removeSearchRows(mConnection, mStudyId);
        else
            putSearchRows(mConnection, mStudyId, built.search, built.tagFile);
        // What was shown so far is what the rows were taken from, whatever tag file the study is said to have.
        const bool isSame = built.movedTo.isEmpty() && row.tagFile.digest == built.tagFile.digest;
        if (row.isBuilt && (isSame || built.isOnlyRearranged))
            return;
        noteChange(mConnection,
                   {kindOf(built, row, instances), mStudy.uid, built.movedFrom, built.movedTo, instances});
    }

    static ChangeKind kindOf(const BuiltStudy& built, const SearchRowState& row, int instances)
    {
        if (!built.movedTo.isEmpty())
            return ChangeKind::Moved;
        if (!row.isBuilt || instances > row.instances)
            return ChangeKind::Arrived;
        return instances < row.instances ? ChangeKind::Deleted : ChangeKind::Corrected;
    }

    void describe(const std::vector<DicomFileRecord>& series)
    {
        if (!series.empty())
            describeStudy(mConnection, mStudyId, series.front());
        for (const DicomFileRecord& image : series) {
            qint64 seriesId = 0;
            {
                SqlRows rows = mConnection.ask("SELECT id FROM series WHERE study_id = ? AND uid = ?",
                                               {mStudyId, textValue(image.seriesInstanceUID)});
                seriesId = rows.next() ? rows.number(0) : 0;
            }
            // It may have been removed meanwhile.
            if (seriesId != 0)
                describeSeries(mConnection, seriesId, image);
        }
    }

    SqlConnection& mConnection;
    const std::unique_ptr<StudyLock> mLock;
    const qint64 mStudyId;
    LockedStudy mStudy;
};

struct Request
{
    qint64 id = 0;
    qint64 studyId = 0;
};

/// The requests after `last`, in the order in which they came; of those that only added files the ones that were left
/// up to `addedUntil`.
std::vector<Request> pageOfQueue(SqlConnection& connection, qint64 last, qint64 addedUntil)
{
    std::vector<Request> page;
    connection.transact(SqlConnection::Access::Read, [&] {
        SqlRows rows = connection.ask("SELECT id, study_id FROM build_request WHERE id > ? AND due <= ?"
                                      " AND (adds <> 1 OR since <= ?) ORDER BY id LIMIT ?",
                                      {last, presentMs(), addedUntil, kPageOfQueue});
        while (rows.next())
            page.push_back({rows.number(0), rows.number(1)});
    });
    return page;
}

/// Goes through the queue and locks the first study that is free.
class QueueWalk
{
public:
    QueueWalk(SqlConnection& connection, qint64 addedUntil)
        : mConnection(connection)
        , mAddedUntil(addedUntil)
    {
    }

    std::unique_ptr<StudyClaim> claimFirst(const QSet<int>& except)
    {
        for (const int studyId : except)
            mPassed.insert(studyId);
        std::unique_ptr<StudyClaim> claim;
        qint64 last = 0;
        // By number and not by counting rows, since requests come and go while the queue is walked.
        for (auto page = pageOfQueue(mConnection, last, mAddedUntil); !claim && !page.empty();
             page = pageOfQueue(mConnection, last, mAddedUntil)) {
            last = page.back().id;
            claim = claimOneOf(page);
        }
        return claim;
    }

private:
    std::unique_ptr<StudyClaim> claimOneOf(const std::vector<Request>& page)
    {
        std::unique_ptr<StudyClaim> claim;
        for (auto request = page.begin(); !claim && request != page.end(); ++request) {
            // A study may have several requests, but it is tried once.
            if (mPassed.contains(request->studyId))
                continue;
            mPassed.insert(request->studyId);
            claim = tryClaim(request->studyId);
        }
        return claim;
    }

    std::unique_ptr<StudyClaim> tryClaim(qint64 studyId)
    {
        if (!mLock)
            mLock = StudyLock::make(mConnection.address());
        if (!mLock->tryLock(studyId))
            return nullptr;
        LockedStudy study = readLocked(mConnection, studyId);
        // Its former holder may have done the work since the queue was read.
        if (study.requests.isEmpty()) {
            mLock->unlock();
            return nullptr;
        }
        return std::make_unique<SqlStudyClaim>(mConnection, std::move(mLock), studyId, std::move(study));
    }

    SqlConnection& mConnection;
    const qint64 mAddedUntil;  // [ms since the epoch]
    std::unique_ptr<StudyLock>
        mLock;             // made when there is something to lock: it may be a connection to a server
    QSet<qint64> mPassed;  // studies
};

/// Null when another holds the study.
std::unique_ptr<StudyClaim> tryClaim(SqlConnection& connection, std::unique_ptr<StudyLock>& lock,
                                     const QByteArray& studyUID, Catalogue::IfAbsent ifAbsent)
{
    qint64 studyId = 0;
    connection.transact(SqlConnection::Access::Read, [&] {
        studyId = ifAbsent == Catalogue::IfAbsent::Create ? findStudyId(connection, studyUID)
                                                          : obtainStudyId(connection, studyUID);
    });
    // Apart from the search, since a study mostly exists and reading waits for nobody.
    if (studyId == 0)
        connection.transact(SqlConnection::Access::Write,
                            [&] { studyId = obtainStudy(connection, studyUID).id; });
    if (!lock->tryLock(studyId))
        return nullptr;
    LockedStudy study = readLocked(connection, studyId);
    // It may have been removed, and registered again under another id, before it was locked.
    if (!study.isThere) {
        lock->unlock();
        return nullptr;
    }
    return std::make_unique<SqlStudyClaim>(connection, std::move(lock), studyId, std::move(study));
}

}  // namespace

Kdd::Result SqlCatalogue::claimNext(const QSet<int>& except, std::unique_ptr<StudyClaim>& claim)
{
    claim.reset();
    return attempt(mConnection.address(), [&] {
        claim = QueueWalk(mConnection, std::numeric_limits<qint64>::max()).claimFirst(except);
    });
}

Kdd::Result SqlCatalogue::claimRested(const QSet<int>& except, int restMs, std::unique_ptr<StudyClaim>& claim)
{
    claim.reset();
    return attempt(mConnection.address(),
                   [&] { claim = QueueWalk(mConnection, presentMs() - restMs).claimFirst(except); });
}

Kdd::Result SqlCatalogue::claim(const QByteArray& studyUID, int patienceMs,
                                std::unique_ptr<StudyClaim>& claim, IfAbsent ifAbsent)
{
    claim.reset();
    return attempt(mConnection.address(), [&] {
        QElapsedTimer waited;
        waited.start();
        // One for all attempts, as it may be a connection to a server. The study is looked up each time: its
        // id may change.
        std::unique_ptr<StudyLock> lock = StudyLock::make(mConnection.address());
        while (!(claim = tryClaim(mConnection, lock, studyUID, ifAbsent)) && waited.elapsed() < patienceMs)
            QThread::msleep(kPause);
    });
}

}  // namespace Kxg
