#include "platform/os/JournaledWrite.h"

#include "platform/os/ExclusiveFile.h"
#include "platform/os/PathName.h"

#include <QFile>
#include <QFileInfo>
#include <QtEndian>

#include <fcntl.h>
#include <libdeflate.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <limits>

namespace Kdd
{
namespace
{

constexpr char kMagic[] = {'K', 'D', 'D', 'J', 'R', 'N', 'L', '1'};
constexpr int kLengthAt = 8;
constexpr int kChecksumAt = 16;
constexpr int kHeaderSize = 20;
// What a QByteArray can hold, with room for its own bookkeeping.
constexpr quint64 kMaxContent = std::numeric_limits<int>::max() - 64;

/// Closed with the object, or before by close() where the answer counts.
class Descriptor
{
public:
    explicit Descriptor(int fd)
        : mFd(fd)
    {
    }
    ~Descriptor() { close(); }
    Descriptor(const Descriptor&) = delete;
    Descriptor& operator=(const Descriptor&) = delete;

    int fd() const { return mFd; }

    /// 0, or the errno of a write error that the file system kept back until now.
    int close()
    {
        const int fd = mFd;
        mFd = -1;
        return fd < 0 || ::close(fd) == 0 ? 0 : errno;
    }

private:
    int mFd;
};

SystemResult failed(const char* action, const QString& path, int error, const QString& reason)
{
    return SystemResult::failure(
        error, QStringLiteral("cannot %1 %2: %3").arg(QString::fromLatin1(action), path, reason));
}

SystemResult failed(const char* action, const QString& path, int error)
{
    return failed(action, path, error, SystemResult::textOf(error));
}

int openFile(const QString& path, int flags, mode_t mode = 0)
{
    // A pipe of that name would be waited for without end.
    return ::open(pathBytes(path).constData(), flags | O_CLOEXEC | O_NONBLOCK, mode);
}

// The small functions below give 0, or the errno.

int writeAll(int fd, const QByteArray& bytes, off_t at)
{
    for (int done = 0; done < bytes.size();) {
        const auto left = static_cast<size_t>(bytes.size() - done);
        // By offset: the position that the QFile above knows of stays as it is.
        const ssize_t written = ::pwrite(fd, bytes.constData() + done, left, at + done);
        if (written < 0 && errno == EINTR)
            continue;
        // Nothing written and no error either would go on for ever.
        if (written <= 0)
            return written < 0 ? errno : EIO;
        done += static_cast<int>(written);
    }
    return 0;
}

int readAll(int fd, QByteArray& bytes, off_t at)
{
    for (int done = 0; done < bytes.size();) {
        const auto left = static_cast<size_t>(bytes.size() - done);
        const ssize_t got = ::pread(fd, bytes.data() + done, left, at + done);
        if (got < 0 && errno == EINTR)
            continue;
        // The end of the file: it has become shorter since it was asked for its size.
        if (got <= 0)
            return got < 0 ? errno : EIO;
        done += static_cast<int>(got);
    }
    return 0;
}

int confirm(int fd, Flush flush)
{
    if (flush == Flush::Disk)
        return ::fsync(fd) == 0 ? 0 : errno;
    // Network file systems keep write errors back until a descriptor is closed; closing a duplicate brings them out
    // and keeps the lock.
    Descriptor duplicate(::fcntl(fd, F_DUPFD_CLOEXEC, 0));
    return duplicate.fd() < 0 ? errno : duplicate.close();
}

int flushFolderOf(const QString& path)
{
    const Descriptor folder(openFile(QFileInfo(path).path(), O_RDONLY | O_DIRECTORY));
    if (folder.fd() < 0)
        return errno;
    // EINVAL: a file system that knows no flushing of folders, so nothing is left to do.
    return ::fsync(folder.fd()) == 0 || errno == EINVAL ? 0 : errno;
}

/// Takes the room before the first old byte changes, so that a full disk is a refusal and not a torn file.
int reserve(int fd, off_t size)
{
    // The system refuses to reserve nothing.
    if (size == 0)
        return 0;
    int error = 0;
    do {
        error = ::posix_fallocate(fd, 0, size);
    } while (error == EINTR);
    // A file system that cannot reserve is no fault: a full disk then shows while writing, with the journal complete.
    return error == EOPNOTSUPP || error == EINVAL ? 0 : error;
}

int putInPlace(int fd, const QByteArray& content, WriteOptions options)
{
    const int error = writeAll(fd, content, 0);
    if (error != 0)
        return error;
    if (options.tail == Tail::Cut && ::ftruncate(fd, content.size()) != 0)
        return errno;
    return confirm(fd, options.flush);
}

/// Bytes that the QFile has read ahead would hide what is written beneath it, and bytes that it holds back for
/// writing would land on top.
bool emptyBuffers(QFile& file)
{
    // Every seek writes what is held back. One within the bytes read ahead keeps them, hence by way of the end.
    return file.seek(file.size()) && file.seek(0);
}

SystemResult removeJournal(const QString& path)
{
    const QString journal = journalPath(path);
    const bool gone = ::unlink(pathBytes(journal).constData()) == 0 || errno == ENOENT;
    return gone ? SystemResult() : failed("remove", journal, errno);
}

quint32 checksum(const QByteArray& content)
{
    return libdeflate_crc32(0, content.constData(), static_cast<size_t>(content.size()));
}

QByteArray journalHeader(const QByteArray& content)
{
    QByteArray header(kHeaderSize, '\0');
    std::memcpy(header.data(), kMagic, sizeof kMagic);
    qToLittleEndian(static_cast<quint64>(content.size()), header.data() + kLengthAt);
    qToLittleEndian(checksum(content), header.data() + kChecksumAt);
    return header;
}

int fillJournal(Descriptor& journal, const QByteArray& content, mode_t mode, Flush flush)
{
    // Whoever may write the file must be able to recover it, whatever the umask here. Where modes mean nothing this
    // fails, and that does no harm.
    static_cast<void>(::fchmod(journal.fd(), mode));
    int error = writeAll(journal.fd(), journalHeader(content), 0);
    if (error == 0)
        error = writeAll(journal.fd(), content, kHeaderSize);
    if (error == 0 && flush == Flush::Disk)
        error = confirm(journal.fd(), flush);
    // Closing brings out the write errors that a network file system has kept back.
    return error == 0 ? journal.close() : error;
}

SystemResult writeJournal(const QString& path, const QByteArray& content, mode_t mode, Flush flush)
{
    const QString name = journalPath(path);
    // A link in place of the journal would lead the write into a foreign file.
    Descriptor journal(openFile(name, O_WRONLY | O_CREAT | O_TRUNC | O_NOFOLLOW, mode));
    if (journal.fd() < 0)
        return failed("create", name, errno);
    int error = fillJournal(journal, content, mode, flush);
    // The journal's name must be on the disk as well before the file changes, or nobody would find it after a
    // loss of power.
    if (error == 0 && flush == Flush::Disk)
        error = flushFolderOf(path);
    if (error == 0)
        return {};
    removeJournal(path);
    return failed("write", name, error);
}

/// What a journal file holds; as made, that of a damaged one. An error of the disk is another thing: it may pass.
struct JournalContent
{
    bool isComplete = false;
    QByteArray bytes;
    int error = 0;
};

JournalContent readJournal(int fd)
{
    struct stat found = {};
    if (::fstat(fd, &found) != 0)
        return {false, {}, errno};
    // Its writer died while it began.
    if (found.st_size < kHeaderSize)
        return {};
    QByteArray header(kHeaderSize, Qt::Uninitialized);
    if (const int error = readAll(fd, header, 0))
        return {false, {}, error};
    const auto length = qFromLittleEndian<quint64>(header.constData() + kLengthAt);
    // The length must be that of the file to the byte before memory is taken for it.
    if (std::memcmp(header.constData(), kMagic, sizeof kMagic) != 0 || length > kMaxContent ||
        length != static_cast<quint64>(found.st_size - kHeaderSize))
        return {};

    QByteArray content(static_cast<int>(length), Qt::Uninitialized);
    if (const int error = readAll(fd, content, kHeaderSize))
        return {false, {}, error};
    // The length alone does not tell: room that was never written reads as zeros after a loss of power.
    if (checksum(content) != qFromLittleEndian<quint32>(header.constData() + kChecksumAt))
        return {};
    return {true, content, 0};
}

SystemResult reserveOrUndo(int fd, const QString& path, off_t formerSize, int newSize)
{
    const int error = reserve(fd, newSize);
    if (error == 0)
        return {};
    // Some of the room may have been added already. Should the cut fail, there are zeros behind the old content.
    [[maybe_unused]] const int cut = ::ftruncate(fd, formerSize);
    removeJournal(path);
    return failed("reserve room for", path, error);
}

}  // namespace

QString journalPath(const QString& path)
{
    return path + QLatin1String(".journal");
}

bool hasJournal(const QString& path)
{
    struct stat found = {};
    // A link counts, also one that leads nowhere: recovery then fails with a reason instead of passing it
    // over.
    return ::lstat(pathBytes(journalPath(path)).constData(), &found) == 0;
}

SystemResult writeInPlace(QFile& locked, const QString& path, const QByteArray& content, WriteOptions options)
{
    // A torn file must be whole before its journal, the only copy of what belongs there, is overwritten.
    SystemResult result = recoverInterruptedWrite(locked, path, options.flush);
    if (result.bad())
        return result;
    struct stat former = {};
    if (::fstat(locked.handle(), &former) != 0)
        return failed("examine", path, errno);
    result = writeJournal(path, content, former.st_mode & 0777, options.flush);
    if (result.good())
        result = reserveOrUndo(locked.handle(), path, former.st_size, content.size());
    if (result.bad())
        return result;
    // From here on the journal stays after any failure: it holds the only whole copy.
    if (const int error = putInPlace(locked.handle(), content, options))
        return failed("write", path, error);
    return removeJournal(path);
}

SystemResult recoverInterruptedWrite(QFile& locked, const QString& path, Flush flush)
{
    if (!locked.isOpen())
        return failed("prepare", path, EBADF);
    if (!emptyBuffers(locked))
        return failed("prepare", path, EIO, locked.errorString());
    const QString name = journalPath(path);
    const Descriptor journal(openFile(name, O_RDONLY | O_NOFOLLOW));
    if (journal.fd() < 0)
        return errno == ENOENT ? SystemResult() : failed("open", name, errno);
    const JournalContent content = readJournal(journal.fd());
    if (content.error != 0)
        return failed("read", name, content.error);
    if (!content.isComplete)
        return removeJournal(path);
    // What lies behind a shorter content stays, because the journal does not tell whether its writer wanted
    // it cut.
    if (const int error = putInPlace(locked.handle(), content.bytes, {flush, Tail::Keep}))
        return failed("write", path, error);
    return removeJournal(path);
}

SystemResult removeWithJournal(QFile& locked, const QString& path)
{
    // The journal first: one without its file would become the content of the next file of that name.
    SystemResult result = removeJournal(path);
    if (result.bad()) {
        locked.close();
        return result;
    }
    result = removeLocked(locked, path);
    const int error = result.good() ? flushFolderOf(path) : result.error();
    return error == 0 ? SystemResult() : failed("remove", path, error);
}

}  // namespace Kdd
