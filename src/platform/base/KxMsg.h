#pragma once

#include "platform/base/Export.h"
#include "platform/base/Geometry.h"

#include <QByteArray>

#include <utility>

namespace Kdd
{

/// A byte message: values are appended with `<<` and taken from its head with `>>`.
///
/// Encoding: integers of fixed width and IEEE floats, little-endian and without padding; `Vec3i` is three signed
/// 32-bit integers, `Box3f` six floats (xmin, xmax, ymin, ymax, zmin, zmax), `Mat4f` sixteen floats row by row.
///
/// Reading past the end gives zeros, takes nothing and leaves the message failed for good, so a reader may take a
/// whole record and look at `failed()` once. Nothing throws and no byte outside the message is touched. A value; each
/// thread uses one of its own.
class KDD_EXPORT KxMsg
{
public:
    /// An empty message to write to.
    KxMsg() = default;

    /// A message to read; shares the bytes.
    explicit KxMsg(QByteArray bytes)
        : mBytes(std::move(bytes))
    {
    }

    KxMsg& operator<<(quint8 value);
    KxMsg& operator<<(quint16 value);
    KxMsg& operator<<(qint32 value);
    KxMsg& operator<<(quint32 value);
    KxMsg& operator<<(float value);
    KxMsg& operator<<(const Vec3i& value);
    KxMsg& operator<<(const Box3f& value);
    KxMsg& operator<<(const Mat4f& value);
    void write(const QByteArray& raw) { mBytes.append(raw); }

    KxMsg& operator>>(quint8& value);
    KxMsg& operator>>(quint16& value);
    KxMsg& operator>>(qint32& value);
    KxMsg& operator>>(quint32& value);
    KxMsg& operator>>(float& value);
    KxMsg& operator>>(Vec3i& value);
    KxMsg& operator>>(Box3f& value);
    KxMsg& operator>>(Mat4f& value);

    /// The next `count` bytes, copied. A negative count, or more than is left, fails the message and gives nothing.
    QByteArray read(qint64 count);

    /// The next `count` bytes as a message of its own. It shares the storage of this one and must not outlive it.
    KxMsg readMessage(qint64 count);

    /// Where the next value would be written [bytes from the start].
    int position() const { return mBytes.size(); }

    /// Puts `bytes` in the place of `count` bytes at `position`, moving what follows.
    void replace(int position, int count, const QByteArray& bytes) { mBytes.replace(position, count, bytes); }

    void reserve(int bytes) { mBytes.reserve(bytes); }
    void reset();

    const QByteArray& bytes() const { return mBytes; }
    int size() const { return mBytes.size(); }
    int remaining() const { return mBytes.size() - mRead; }
    bool failed() const { return mFailed; }
    void setFailed() { mFailed = true; }

private:
    template <typename T>
    KxMsg& put(T value);
    template <typename T>
    KxMsg& take(T& value);
    bool has(qint64 count);

    QByteArray mBytes;
    int mRead = 0;
    bool mFailed = false;
};

}  // namespace Kdd
