#pragma once

#include "platform/database/DatabaseAddress.h"

#include <memory>

namespace Kxg
{

/// Holds at most one study among all threads, processes and machines that use a database. What it holds is free again
/// when the object goes, and also when its process dies. Failures throw DatabaseError.
///
/// No row is locked for that: whoever builds a study may take minutes, and others register and remove files of it
/// meanwhile. So may the holder, whose changes run over another connection.
class StudyLock
{
public:
    static std::unique_ptr<StudyLock> make(const DatabaseAddress& address);

    virtual ~StudyLock() = default;
    StudyLock(const StudyLock&) = delete;
    StudyLock& operator=(const StudyLock&) = delete;

    /// False when another object holds the study. Does not wait.
    virtual bool tryLock(qint64 studyId) = 0;

    virtual void unlock() = 0;

    /// Throws when the study may have been lost to others since it was locked.
    virtual void confirm() = 0;

protected:
    StudyLock() = default;
};

std::unique_ptr<StudyLock> makeSqliteStudyLock(const DatabaseAddress& address);
std::unique_ptr<StudyLock> makePostgresStudyLock(const DatabaseAddress& address);

}  // namespace Kxg
