#include "platform/base/KxMsg.h"

#include <QtEndian>

namespace Kdd
{

/// Every number goes through here and is taken below, so the order of bytes is decided in two places only.
template <typename T>
KxMsg& KxMsg::put(T value)
{
    const T little = qToLittleEndian(value);
    mBytes.append(reinterpret_cast<const char*>(&little), static_cast<int>(sizeof little));
    return *this;
}

template <typename T>
KxMsg& KxMsg::take(T& value)
{
    // Set in any case, so that whoever asks for a failure only at the end has read nothing undefined.
    value = T();
    if (!has(static_cast<qint64>(sizeof value)))
        return *this;
    value = qFromLittleEndian<T>(mBytes.constData() + mRead);
    mRead += static_cast<int>(sizeof value);
    return *this;
}

/// A failure is for good: what would be read after it is out of step.
bool KxMsg::has(qint64 count)
{
    if (!mFailed && count >= 0 && count <= remaining())
        return true;
    mFailed = true;
    return false;
}

KxMsg& KxMsg::operator<<(quint8 value)
{
    return put(value);
}

KxMsg& KxMsg::operator<<(quint16 value)
{
    return put(value);
}

KxMsg& KxMsg::operator<<(qint32 value)
{
    return put(value);
}

KxMsg& KxMsg::operator<<(quint32 value)
{
    return put(value);
}

KxMsg& KxMsg::operator<<(float value)
{
    return put(value);
}

KxMsg& KxMsg::operator<<(const Vec3i& value)
{
    return *this << value.x << value.y << value.z;
}

KxMsg& KxMsg::operator<<(const Box3f& value)
{
    return *this << value.xmin << value.xmax << value.ymin << value.ymax << value.zmin << value.zmax;
}

KxMsg& KxMsg::operator<<(const Mat4f& value)
{
    for (const float cell : value.m)
        *this << cell;
    return *this;
}

KxMsg& KxMsg::operator>>(quint8& value)
{
    return take(value);
}

KxMsg& KxMsg::operator>>(quint16& value)
{
    return take(value);
}

KxMsg& KxMsg::operator>>(qint32& value)
{
    return take(value);
}

KxMsg& KxMsg::operator>>(quint32& value)
{
    return take(value);
}

KxMsg& KxMsg::operator>>(float& value)
{
    return take(value);
}

KxMsg& KxMsg::operator>>(Vec3i& value)
{
    return *this >> value.x >> value.y >> value.z;
}

KxMsg& KxMsg::operator>>(Box3f& value)
{
    return *this >> value.xmin >> value.xmax >> value.ymin >> value.ymax >> value.zmin >> value.zmax;
}

KxMsg& KxMsg::operator>>(Mat4f& value)
{
    for (float& cell : value.m)
        *this >> cell;
    return *this;
}

QByteArray KxMsg::read(qint64 count)
{
    if (!has(count))
        return {};
    QByteArray taken(mBytes.constData() + mRead, static_cast<int>(count));
    mRead += static_cast<int>(count);
    return taken;
}

KxMsg KxMsg::readMessage(qint64 count)
{
    if (!has(count)) {
        // Both have failed: the part has nothing to give, and what follows it is out of step.
        KxMsg failed;
        failed.setFailed();
        return failed;
    }
    // Not copied: a study's messages hold each other, and every level would cost its bytes once more.
    KxMsg part(QByteArray::fromRawData(mBytes.constData() + mRead, static_cast<int>(count)));
    mRead += static_cast<int>(count);
    return part;
}

void KxMsg::reset()
{
    *this = KxMsg();
}

}  // namespace Kdd
