#pragma once

#include "platform/os/SystemResult.h"

#include <QByteArray>

namespace Kdd
{

/// A file that is written under a name for which nobody looks, and gets its own name when it is whole. What was not
/// kept is removed with the object. Used by one thread at a time.
class StagedFile
{
public:
    StagedFile() = default;
    ~StagedFile();
    StagedFile(const StagedFile&) = delete;
    StagedFile& operator=(const StagedFile&) = delete;

    /// Makes the file, which must not be there. To be called once.
    SystemResult create(const QByteArray& path);

    SystemResult append(const char* bytes, qint64 count);

    /// Has the system begin to write, so that flushing waits for less.
    void startFlush() const;

    /// What was written is on the disk from here on, and nothing more is written.
    SystemResult flush();

    /// Changes the name under which it waits. Over what has that name it is put.
    SystemResult rename(const QByteArray& path);

    /// Gives it a second name in the same file system, over which nothing is put: EEXIST where there is a file.
    SystemResult linkTo(const QByteArray& path) const;

    /// Leaves the first name behind, for whoever cleans up later.
    void keep() { mIsKept = true; }

    const QByteArray& path() const { return mPath; }
    qint64 size() const { return mSize; }

    /// Of what was written (CRC-32).
    quint32 checksum() const { return mChecksum; }

private:
    void close();

    QByteArray mPath;
    qint64 mSize = 0;
    quint32 mChecksum = 0;
    int mDescriptor = -1;
    bool mIsKept = false;
};

/// Makes a folder with all above it, and flushes what names each new one.
SystemResult makeLastingFolder(const QByteArray& path);

/// The names in a folder are on the disk from here on.
SystemResult flushFolder(const QByteArray& path);

/// What is in a file is on the disk from here on.
SystemResult flushFile(const QByteArray& path);

/// What is in a file is on the disk from here on, and so is its name.
SystemResult flushNamedFile(const QByteArray& path);

/// The checksum of a file (CRC-32).
SystemResult readChecksum(const QByteArray& path, quint32& checksum);

/// What is left for files of this user [bytes]; -1 when it cannot be told.
qint64 freeSpace(const QByteArray& path);

/// How many names the file has; 0 when it is absent.
int linkCount(const QByteArray& path);

/// Whether both names lead to one file.
bool isSameFile(const QByteArray& path, const QByteArray& other);

/// A file that stands for the right to do something, which one holder has at a time among all threads and processes.
/// The right ends with the object, and with its process.
class LockFile
{
public:
    enum class IfHeld { Wait, Fail };

    LockFile() = default;
    ~LockFile();
    LockFile(const LockFile&) = delete;
    LockFile& operator=(const LockFile&) = delete;

    /// Makes the file where it is absent; it stays. EWOULDBLOCK: another one has the right. To be called once.
    SystemResult acquire(const QByteArray& path, IfHeld ifHeld);

private:
    int mDescriptor = -1;
};

}  // namespace Kdd
