#include "platform/database/SqlConnection.h"
#include "platform/database/StudyLock.h"
#include "platform/os/SystemResult.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>

namespace Kxg
{
namespace
{

/// A file beside the database in which the byte at a study's id is locked; nothing is written to it. The lock belongs
/// to the open file and not to the process, so that it holds among threads as well.
class SqliteStudyLock : public StudyLock
{
public:
    explicit SqliteStudyLock(const DatabaseAddress& address)
        : mPath(address.database + QLatin1String(".claims"))
        , mFd(::open(mPath.toUtf8().constData(), O_RDWR | O_CREAT | O_CLOEXEC, 0666))
    {
        if (mFd < 0)
            fail("open", errno);
    }
    ~SqliteStudyLock() override { ::close(mFd); }

    bool tryLock(qint64 studyId) override
    {
        if (!set(F_WRLCK, studyId))
            return false;
        mHeld = studyId;
        return true;
    }

    void unlock() override { set(F_UNLCK, mHeld); }

    // The system keeps the lock as long as the file is open, so there is nothing to ask.
    void confirm() override {}

private:
    bool set(int type, qint64 studyId) const
    {
        struct flock range = {};
        range.l_type = static_cast<short>(type);
        range.l_whence = SEEK_SET;
        range.l_start = studyId;
        range.l_len = 1;
        // Not waiting either. Closing any other descriptor of the file does not end this kind of lock.
        while (::fcntl(mFd, F_OFD_SETLK, &range) != 0) {
            if (errno == EAGAIN || errno == EACCES)
                return false;
            if (errno != EINTR)
                fail("lock", errno);
        }
        return true;
    }

    [[noreturn]] void fail(const char* action, int error) const
    {
        throw DatabaseError(QStringLiteral("cannot %1 %2: %3")
                                .arg(QString::fromLatin1(action), mPath, Kdd::SystemResult::textOf(error)));
    }

    const QString mPath;
    const int mFd;
    qint64 mHeld = 0;
};

}  // namespace

std::unique_ptr<StudyLock> makeSqliteStudyLock(const DatabaseAddress& address)
{
    return std::make_unique<SqliteStudyLock>(address);
}

}  // namespace Kxg
