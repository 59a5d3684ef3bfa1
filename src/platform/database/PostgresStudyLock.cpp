#include "platform/database/SqlConnection.h"
#include "platform/database/SqlDialect.h"
#include "platform/database/StudyLock.h"

namespace Kxg
{
namespace
{

/// A numbered lock of the server's, held by a connection of its own: within one connection such locks would not
/// exclude each other.
class PostgresStudyLock : public StudyLock
{
public:
    explicit PostgresStudyLock(const DatabaseAddress& address)
        : mConnection(address, SqlConnection::IfAbsent::Fail)
    {
    }

    bool tryLock(qint64 studyId) override
    {
        // Never waiting in the server: whoever claims counts his patience himself.
        SqlRows rows = mConnection.ask("SELECT pg_try_advisory_lock(?, ?)", {kAdvisoryLocks, studyId});
        if (!rows.next() || !rows.truth(0))
            return false;
        mHeld = studyId;
        return true;
    }

    void unlock() override { mConnection.ask("SELECT pg_advisory_unlock(?, ?)", {kAdvisoryLocks, mHeld}); }

    /// The connection is never opened anew, so its answer proves that it still holds what it held.
    void confirm() override { mConnection.execute(QStringLiteral("SELECT 1")); }

private:
    SqlConnection mConnection;
    qint64 mHeld = 0;
};

}  // namespace

std::unique_ptr<StudyLock> makePostgresStudyLock(const DatabaseAddress& address)
{
    return std::make_unique<PostgresStudyLock>(address);
}

std::unique_ptr<StudyLock> StudyLock::make(const DatabaseAddress& address)
{
    return address.engine == DatabaseAddress::Engine::Sqlite ? makeSqliteStudyLock(address)
                                                             : makePostgresStudyLock(address);
}

}  // namespace Kxg
