#include "kddlib/tagmodel/TagElement.h"

#include <QDateTime>
#include <QtEndian>

namespace Kdd
{

namespace
{

template <typename T>
QByteArray bytesOf(T value)
{
    return QByteArray(reinterpret_cast<const char*>(&value), static_cast<int>(sizeof value));
}

/// Bytes of one value of the VRs whose values are counted by length; 0 for all others.
int fieldSize(VrCode vr)
{
    switch (vr) {
    case VrCode::OB:
        return 1;
    case VrCode::OW:
    case VrCode::SS:
    case VrCode::US:
        return 2;
    case VrCode::FL:
    case VrCode::OF:
    case VrCode::SL:
    case VrCode::UL:
        return 4;
    case VrCode::FD:
        return 8;
    default:
        return 0;
    }
}

bool isNumberText(VrCode vr)
{
    return vr == VrCode::AS || vr == VrCode::DA || vr == VrCode::DS || vr == VrCode::IS;
}

/// Index 0 stands for the whole text, which is not split for it: several values are no number then.
int textAsInt(const QByteArray& text, int index, bool& ok)
{
    if (index == 0)
        return text.toInt(&ok, 10);
    const QList<QByteArray> parts = text.split('\\');
    ok = index > 0 && index < parts.size();
    return ok ? parts.at(index).toInt(&ok, 10) : 0;
}

/// The value of an int: an unsigned number of 32 bits from 2^31 on comes out negative, with the same bits. A
/// caller that needs it whole looks at the VR.
int numberAt(const char* at, VrCode vr)
{
    switch (vr) {
    case VrCode::OB:
        return static_cast<unsigned char>(*at);
    case VrCode::SS:
        return qFromLittleEndian<qint16>(at);
    case VrCode::SL:
    case VrCode::UL:
        return qFromLittleEndian<qint32>(at);
    default:
        return qFromLittleEndian<quint16>(at);
    }
}

/// Floats are none, whatever their value, and neither are words of which nobody told the sign.
bool holdsIntegers(VrCode vr)
{
    return vr == VrCode::OB || vr == VrCode::OW || vr == VrCode::US || vr == VrCode::SS || vr == VrCode::SL ||
           vr == VrCode::UL;
}

QDate dateOf(const QByteArray& text)
{
    return {text.mid(0, 4).toInt(), text.mid(4, 2).toInt(), text.mid(6, 2).toInt()};
}

QTime timeOf(const QByteArray& text)
{
    return {text.mid(0, 2).toInt(), text.mid(2, 2).toInt(), text.mid(4, 2).toInt()};
}

/// A day or a time that does not exist is no value.
template <typename Moment>
QVariant ifValid(const Moment& moment)
{
    return moment.isValid() ? QVariant(moment) : QVariant();
}

/// Eight digits only. The form with dots that the oldest files have counts as malformed.
QVariant asDate(const QByteArray& text)
{
    const QByteArray trimmed = text.trimmed();
    return trimmed.size() == 8 ? ifValid(dateOf(trimmed)) : QVariant();
}

/// The fraction of a second is left out. DICOM lets minutes and seconds be missing; such a time
/// is not completed and counts as malformed.
QVariant asTime(const QByteArray& text)
{
    const QByteArray trimmed = text.trimmed().left(6);
    return trimmed.size() == 6 ? ifValid(timeOf(trimmed)) : QVariant();
}

/// Fraction and time zone are left out, as the result is a local time in whole seconds.
QVariant asDateTime(const QByteArray& text)
{
    const QByteArray trimmed = text.trimmed().left(14);
    if (trimmed.size() != 14)
        return {};
    return ifValid(QDateTime(dateOf(trimmed), timeOf(trimmed.mid(8))));
}

QVariant typedValue(const QByteArray& text, VrCode vr)
{
    switch (vr) {
    case VrCode::DA:
        return asDate(text);
    case VrCode::DS:
        return text.toDouble();
    case VrCode::DT:
        return asDateTime(text);
    case VrCode::IS:
        return text.toInt(nullptr, 10);
    case VrCode::TM:
        return asTime(text);
    default:
        return QString::fromLatin1(text);
    }
}

}  // namespace

TagElement::~TagElement() = default;

bool TagElement::compare(const TagElement& other, bool checkVR, std::string* diffs) const
{
    if ((!checkVR || mVr == other.mVr) && mValue == other.mValue)
        return true;
    if (diffs != nullptr) {
        QByteArray mine;
        QByteArray theirs;
        getValueAsString(mine);
        other.getValueAsString(theirs);
        const QByteArray line = QByteArray(vrName(mVr)) + " [" + mine + "] <> [" + theirs + "]\n";
        diffs->append(line.constData(), static_cast<std::size_t>(line.size()));
    }
    return false;
}

TagElement* TagElement::clone() const
{
    return new TagElement(mVr, mValue);
}

void TagElement::putValue(int value)
{
    if (value >= 0 && value < 256) {
        mVr = VrCode::OB;
        mValue = bytesOf(static_cast<quint8>(value));
    } else if (value >= 0 && value < 65536) {
        mVr = VrCode::US;
        mValue = bytesOf(qToLittleEndian(static_cast<quint16>(value)));
    } else {
        mVr = VrCode::SL;
        mValue = bytesOf(qToLittleEndian(static_cast<qint32>(value)));
    }
}

int TagElement::numFields() const
{
    if (isNumberText(mVr))
        return mValue.count('\\') + 1;
    const int size = fieldSize(mVr);
    return size > 0 ? mValue.size() / size : 0;
}

int TagElement::valueAsInt(bool* ok, int index) const
{
    bool found = false;
    int number = 0;
    if (isNumberText(mVr)) {
        number = textAsInt(mValue, index, found);
    } else if (holdsIntegers(mVr)) {
        const int size = fieldSize(mVr);
        found = index >= 0 && index < mValue.size() / size;
        if (found)
            number = numberAt(mValue.constData() + static_cast<qptrdiff>(index) * size, mVr);
    }
    if (ok != nullptr)
        *ok = found;
    return number;
}

QVariant TagElement::valueAsVariant() const
{
    QByteArray text;
    getValueAsString(text);
    if (!text.contains('\\'))
        return typedValue(text, mVr);
    QVariantList values;
    for (const QByteArray& part : text.split('\\'))
        values.append(typedValue(part, mVr));
    return values;
}

}  // namespace Kdd
