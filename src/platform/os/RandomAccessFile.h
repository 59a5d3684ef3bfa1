#pragma once

#include "platform/base/Export.h"

#include <QtGlobal>

namespace Kdd
{

/// A file read at any place, without a position of its own. Closed when the object goes.
class KDD_EXPORT RandomAccessFile
{
public:
    RandomAccessFile() = default;
    ~RandomAccessFile();
    RandomAccessFile(const RandomAccessFile&) = delete;
    RandomAccessFile& operator=(const RandomAccessFile&) = delete;

    /// Opens a regular file for reading; 0, else the errno that tells why not. To be called once.
    int open(const char* path);

    /// [bytes], as it was when the file was opened.
    qint64 size() const { return mSize; }

    /// Reads up to `count` bytes at `offset`, fewer only at the end of the file; -1 on a read error.
    qint64 readAt(qint64 offset, void* bytes, qint64 count) const;

private:
    int mDescriptor = -1;
    qint64 mSize = 0;
};

}  // namespace Kdd
