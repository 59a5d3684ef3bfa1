#pragma once

#include <QByteArray>

#include <kddlib/Result.h>

#include <memory>

namespace Kdd::Http
{

/// A file open for reading, of which several answers may send ranges at the same time. Closed with the last of them. What
/// is read is what the file held when it was opened as long as nobody writes into it: files that are replaced by another
/// of their name stay readable.
class OpenFile
{
public:
    /// Null, with the reason in `result`, when it cannot be opened or is no regular file.
    static std::shared_ptr<const OpenFile> open(const QByteArray& path, Result& result);

    ~OpenFile();
    OpenFile(const OpenFile&) = delete;
    OpenFile& operator=(const OpenFile&) = delete;

    int descriptor() const { return mDescriptor; }

    /// As it was when the file was opened [bytes].
    qint64 size() const { return mSize; }

    /// Which file this is, and in which state: equal only for the same bytes. From device, number, size and times.
    const QByteArray& identity() const { return mIdentity; }

    /// Exactly `length` bytes from `offset` on; a shorter file is a failure.
    Result read(qint64 offset, qint64 length, QByteArray& bytes) const;

private:
    OpenFile() = default;

    int mDescriptor = -1;
    qint64 mSize = 0;
    QByteArray mIdentity;
};

/// A part of a file.
struct FileRange
{
    std::shared_ptr<const OpenFile> file;
    qint64 offset = 0;  ///< [bytes]
    qint64 length = 0;  ///< [bytes]
};

}  // namespace Kdd::Http
