#include "platform/database/FileKind.h"
#include "platform/database/ProofRows.h"
#include "platform/database/SqlCatalogue.h"
#include "platform/database/StudyContent.h"
#include "platform/database/StudyLock.h"
#include "platform/database/StudyProofs.h"

#include <algorithm>
#include <utility>

namespace Kxg
{
namespace
{

/// No study's: their ids begin with 1.
constexpr qint64 kCheckLock = 0;

/// When a request is due that no change left: these are due at 0 [ms since the epoch].
constexpr qint64 kSinceEver = 1;

class SqlCheckTurn : public CheckTurn
{
public:
    SqlCheckTurn(DatabaseAddress address, std::unique_ptr<StudyLock> lock)
        : mAddress(std::move(address))
        , mLock(std::move(lock))
    {
    }

    Kdd::Result confirm() override
    {
        return attempt(mAddress, [this] { mLock->confirm(); });
    }

private:
    const DatabaseAddress mAddress;
    const std::unique_ptr<StudyLock> mLock;
};

const char kSelectFile[] = "SELECT file.path, file.size, file.modified, file.digest, file.kind FROM ";

FileDigest fileOf(const SqlRows& rows)
{
    return {rows.bytes(0),
            {rows.number(1), rows.number(2)},
            rows.bytes(3),
            rows.number(4) == static_cast<int>(FileKind::Volume)};
}

}  // namespace

Kdd::Result SqlCatalogue::requestRewrite(const QByteArray& studyUID, qint64& request)
{
    return transact(Access::Write, [&] {
        request = leaveRequest(mConnection, obtainStudyId(mConnection, studyUID), kSinceEver);
    });
}

Kdd::Result SqlCatalogue::tagFileProofs(const QByteArray& studyUID, TagFileProofs& proofs)
{
    return transact(Access::Read, [&] {
        TagFileProofs found;
        const qint64 studyId = readTagFileProofs(mConnection, studyUID, found);
        SqlRows rows = mConnection.ask(
            "SELECT size, digest FROM former_tag_file WHERE study_id = ? ORDER BY id DESC", {studyId});
        while (rows.next())
            found.former.push_back({rows.number(0), rows.bytes(1)});
        proofs = std::move(found);
    });
}

Kdd::Result SqlCatalogue::fileDigests(const QByteArray& studyUID, std::vector<FileDigest>& files)
{
    return transact(Access::Read, [&] {
        std::vector<FileDigest> found;
        SqlRows rows =
            mConnection.ask(QByteArray(kSelectFile) + "study JOIN series ON series.study_id = study.id"
                                                      " JOIN file ON file.series_id = series.id"
                                                      " WHERE study.uid = ? ORDER BY file.path",
                            {textValue(studyUID)});
        while (rows.next())
            found.push_back(fileOf(rows));
        files.swap(found);
    });
}

Kdd::Result SqlCatalogue::fileDigest(const QByteArray& path, FileDigest& file)
{
    return transact(Access::Read, [&] {
        SqlRows rows =
            mConnection.ask(QByteArray(kSelectFile) + "file WHERE file.path = ?", {bytesValue(path)});
        file = rows.next() ? fileOf(rows) : FileDigest();
    });
}

Kdd::Result SqlCatalogue::recordDigests(const std::vector<FileDigest>& digests)
{
    return transact(Access::Write, [&] {
        for (const FileDigest& file : digests)
            mConnection.change(
                "UPDATE file SET digest = ? WHERE path = ? AND size = ? AND modified = ?",
                {bytesValue(file.digest), bytesValue(file.path), file.stamp.size, file.stamp.modified});
    });
}

Kdd::Result SqlCatalogue::nextToCheck(qint64 before, CheckedStudy& study)
{
    return transact(Access::Read, [&] {
        CheckedStudy found;
        SqlRows rows = mConnection.ask("SELECT uid, check_position, check_faults FROM study WHERE checked < ?"
                                       " ORDER BY checked, id LIMIT 1",
                                       {before});
        if (rows.next()) {
            found.studyInstanceUID = rows.text(0);
            found.position = rows.bytes(1);
            // Those of the former look count until this one is at its end.
            found.faults = found.position.isEmpty() ? 0 : static_cast<int>(rows.number(2));
        }
        study = std::move(found);
    });
}

Kdd::Result SqlCatalogue::noteCheck(const CheckedStudy& study, bool isDone)
{
    return transact(Access::Write, [&] {
        if (isDone) {
            mConnection.change(
                "UPDATE study SET checked = ?, check_faults = ?, check_position = NULL WHERE uid = ?",
                {presentMs(), study.faults, textValue(study.studyInstanceUID)});
        } else {
            mConnection.change("UPDATE study SET check_faults = ?, check_position = ? WHERE uid = ?",
                               {study.faults, bytesValue(study.position), textValue(study.studyInstanceUID)});
        }
    });
}

Kdd::Result SqlCatalogue::countFaulty(int& studies)
{
    return transact(Access::Read, [&] {
        SqlRows rows = mConnection.ask("SELECT COUNT(*) FROM study WHERE check_faults > 0");
        if (rows.next())
            studies = static_cast<int>(rows.number(0));
    });
}

Kdd::Result SqlCatalogue::takeCheckTurn(std::unique_ptr<CheckTurn>& turn)
{
    turn.reset();
    return attempt(mConnection.address(), [&] {
        std::unique_ptr<StudyLock> lock = StudyLock::make(mConnection.address());
        if (lock->tryLock(kCheckLock))
            turn = std::make_unique<SqlCheckTurn>(mConnection.address(), std::move(lock));
    });
}

}  // namespace Kxg
