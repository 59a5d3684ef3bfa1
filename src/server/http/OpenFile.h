#pragma once

#include <QByteArray>

#include <kddlib/Result.h>
#include <sys/stat.h>

#include <memory>

namespace Kdd::Http
{

/// A file open for reading, of which several answers may send ranges at the same time. Closed with the last of them. What
/// is read is what the file held when it was opened: files that are replaced by another of their name stay readable, and
/// into which somebody writes give no more.
class OpenFile
{
public:
    /// What becomes of a file whose size or times are others now.
    enum class Changes {
        Refused,
        Ignored,  ///< for files that are never written again, though their times may be set
    };

    /// Null, with the reason in `result`, when it cannot be opened or is no regular file.
    static std::shared_ptr<const OpenFile> open(const QByteArray& path, Result& result,
                                                Changes changes = Changes::Refused);

    ~OpenFile();
    OpenFile(const OpenFile&) = delete;
    OpenFile& operator=(const OpenFile&) = delete;

    int descriptor() const { return mDescriptor; }

    /// As it was when the file was opened [bytes].
    qint64 size() const { return mSize; }

    /// Which file this is, and in which state: equal only for the same bytes. From device, number, size and times.
    const QByteArray& identity() const { return mIdentity; }

    /// Whether the identity can be relied on: a file that was written a moment ago may be written again within the same tick
    /// of its file system's clock, with the same times.
    bool isSettled() const { return mIsSettled; }

    /// Whether what was read from it has to be followed by `checkUnchanged`.
    bool refusesChanges() const { return mChanges == Changes::Refused; }

    /// Fails when somebody wrote into the file since it was opened, so that what was read of it may be another file's.
    Result checkUnchanged() const;

    /// Exactly `length` bytes from `offset` on, as they were when the file was opened; a shorter file is a failure.
    Result read(qint64 offset, qint64 length, QByteArray& bytes) const;

private:
    OpenFile() = default;

    int mDescriptor = -1;
    qint64 mSize = 0;
    QByteArray mIdentity;
    Changes mChanges = Changes::Refused;
    bool mIsSettled = false;
    struct stat mStatus = {};
};

/// A part of a file.
struct FileRange
{
    std::shared_ptr<const OpenFile> file;
    qint64 offset = 0;  ///< [bytes]
    qint64 length = 0;  ///< [bytes]
};

}  // namespace Kdd::Http
