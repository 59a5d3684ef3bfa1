#pragma once

#include "platform/os/SystemResult.h"

#include <QtGlobal>

namespace Kdd
{

/// Which file it is, in which state: what is written to it, or put in its place, makes another.
struct FileIdentity
{
    quint64 device = 0;
    quint64 inode = 0;
    qint64 size = 0;      ///< [bytes]
    qint64 modified = 0;  ///< [ns] since the epoch

    bool operator==(const FileIdentity& other) const
    {
        return device == other.device && inode == other.inode && size == other.size &&
               modified == other.modified;
    }
};

/// A file read at any place, without a position of its own. Closed when the object goes. Once it is open any number
/// of threads may read.
class RandomAccessFile
{
public:
    RandomAccessFile() = default;
    ~RandomAccessFile();
    RandomAccessFile(const RandomAccessFile&) = delete;
    RandomAccessFile& operator=(const RandomAccessFile&) = delete;

    /// Opens a regular file for reading. To be called once.
    SystemResult open(const char* path);

    /// [bytes], as it was when the file was opened.
    qint64 size() const { return mIdentity.size; }

    /// As it was when the file was opened.
    const FileIdentity& identity() const { return mIdentity; }

    /// Whether it still is as it was.
    bool isUnchanged() const;

    /// Asks for bytes that will be read soon, without waiting for them; of no use for what is in memory already.
    void askFor(qint64 offset, qint64 count) const;

    /// Reads up to `count` bytes at `offset`, fewer only at the end of the file; -1 on a read error.
    qint64 readAt(qint64 offset, void* bytes, qint64 count) const;

private:
    int mDescriptor = -1;
    FileIdentity mIdentity;
};

}  // namespace Kdd
