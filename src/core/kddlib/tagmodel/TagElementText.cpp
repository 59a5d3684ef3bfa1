#include "kddlib/tagmodel/TagElement.h"
#include "platform/base/Decimal.h"
#include "platform/base/Tokenizer.h"

#include <QtEndian>

#include <dcmtk/dcmdata/dcdicent.h>
#include <dcmtk/dcmdata/dcdict.h>
#include <dcmtk/dcmdata/dctagkey.h>

#include <cstdlib>

namespace Kdd
{

namespace
{

// Each of them fills, backslashes included, the 64 characters that a dump shows of a value.
constexpr int kWordsShown = 13;
constexpr int kBytesShown = 22;

const char* const kHexDigits = "0123456789abcdef";

void appendHex(QByteArray& out, quint8 byte)
{
    out.append(kHexDigits[byte >> 4]).append(kHexDigits[byte & 15]);
}

void appendHex(QByteArray& out, quint16 word)
{
    appendHex(out, static_cast<quint8>(word >> 8));
    appendHex(out, static_cast<quint8>(word & 0xff));
}

/// QByteArray writes numbers without the process's locale, so a text is the same on every machine.
QByteArray decimal(double value)
{
    return QByteArray::number(value, 'g', 6);
}

template <typename Integer>
QByteArray decimal(Integer value)
{
    return QByteArray::number(static_cast<qlonglong>(value));
}

QByteArray decimal(float value)
{
    return decimal(static_cast<double>(value));
}

/// Appends the complete values of type T in `bytes`, separated by a backslash.
template <typename T>
void appendNumbers(QByteArray& out, const QByteArray& bytes)
{
    const int count = bytes.size() / static_cast<int>(sizeof(T));
    for (int i = 0; i < count; ++i) {
        if (i > 0)
            out.append('\\');
        out.append(
            decimal(qFromLittleEndian<T>(bytes.constData() + static_cast<std::size_t>(i) * sizeof(T))));
    }
}

/// As hexadecimal numbers of type T; from `shown` values on the text ends in "...".
template <typename T>
void appendHexNumbers(QByteArray& out, const QByteArray& bytes, int shown)
{
    const int count = bytes.size() / static_cast<int>(sizeof(T));
    for (int i = 0; i < qMin(count, shown); ++i) {
        if (i > 0)
            out.append('\\');
        appendHex(out, qFromLittleEndian<T>(bytes.constData() + static_cast<std::size_t>(i) * sizeof(T)));
    }
    if (count >= shown)
        out.append("...");
}

void appendTags(QByteArray& out, const QByteArray& bytes)
{
    for (int i = 0; i + 4 <= bytes.size(); i += 4) {
        out.append(i > 0 ? "\\(" : "(");
        appendHex(out, qFromLittleEndian<quint16>(bytes.constData() + i));
        out.append(',');
        appendHex(out, qFromLittleEndian<quint16>(bytes.constData() + i + 2));
        out.append(')');
    }
}

/// In the byte order that elements keep, whatever the machine's.
template <typename T>
void appendBytes(QByteArray& bytes, T value)
{
    const T little = qToLittleEndian(value);
    bytes.append(reinterpret_cast<const char*>(&little), static_cast<int>(sizeof little));
}

/// White space separates words as a backslash does; a word that is no number becomes 0.
template <typename Convert>
QByteArray numbersFromWords(const QByteArray& text, Convert convert)
{
    QByteArray bytes;
    QByteArray word;
    for (Tokenizer words(text); words.next(word);)
        appendBytes(bytes, convert(word.constData()));
    return bytes;
}

}  // namespace

void TagElement::getValueAsString(QByteArray& out, VrCode vr) const
{
    out.clear();
    if (isTextVr(vr)) {
        out = mValue;
        return;
    }
    switch (vr) {
    case VrCode::AT:
        appendTags(out, mValue);
        break;
    case VrCode::FL:
    case VrCode::OF:
        appendNumbers<float>(out, mValue);
        break;
    case VrCode::FD:
        appendNumbers<double>(out, mValue);
        break;
    case VrCode::SL:
        appendNumbers<qint32>(out, mValue);
        break;
    case VrCode::SS:
        appendNumbers<qint16>(out, mValue);
        break;
    case VrCode::UL:
        appendNumbers<quint32>(out, mValue);
        break;
    case VrCode::US:
    case VrCode::Xs:
        appendNumbers<quint16>(out, mValue);
        break;
    case VrCode::OW:
        appendHexNumbers<quint16>(out, mValue, kWordsShown);
        break;
    // Bytes, look-up tables and whatever has no VR that is known.
    default:
        appendHexNumbers<quint8>(out, mValue, kBytesShown);
        break;
    }
}

bool TagElement::getValueAsString(QByteArray& out, const DcmTagKey& key, const char* privateCreator) const
{
    VrCode vr = mVr;
    if (vr == VrCode::UN) {
        // Only while the dictionary is held is the entry sure to be there.
        const DcmDictEntry* entry = dcmDataDict.rdlock().findEntry(key, privateCreator);
        if (entry != nullptr)
            vr = vrCodeOf(entry->getEVR());
        dcmDataDict.rdunlock();
    }
    getValueAsString(out, vr);
    return vr != VrCode::UN;
}

void TagElement::getValueAsStringFromOBOW(QByteArray& out, int type) const
{
    switch (type) {
    case 0:
        appendNumbers<quint16>(out, mValue);
        break;
    case 1:
        appendNumbers<qint16>(out, mValue);
        break;
    case 2:
        appendNumbers<float>(out, mValue);
        break;
    case 3:
        appendNumbers<double>(out, mValue);
        break;
    case 4:
        appendNumbers<qint32>(out, mValue);
        break;
    default:
        break;
    }
}

/// Numbers that the VR cannot hold are not refused here but cut; who corrects values checks them before.
bool TagElement::putValueAsString(const QByteArray& text)
{
    if (isTextVr(mVr)) {
        mValue = text;
        return true;
    }
    const auto toFloat = [](const char* word) { return static_cast<float>(decimalNumber(word)); };
    const auto toInt32 = [](const char* word) { return static_cast<qint32>(std::strtol(word, nullptr, 10)); };
    const auto toInt16 = [](const char* word) { return static_cast<qint16>(std::strtol(word, nullptr, 10)); };
    const auto toUint32 = [](const char* word) {
        return static_cast<quint32>(std::strtoul(word, nullptr, 10));
    };
    const auto toUint16 = [](const char* word) {
        return static_cast<quint16>(std::strtoul(word, nullptr, 10));
    };
    switch (mVr) {
    case VrCode::FL:
    case VrCode::OF:
        mValue = numbersFromWords(text, toFloat);
        return true;
    case VrCode::FD:
        mValue = numbersFromWords(text, decimalNumber);
        return true;
    case VrCode::SL:
        mValue = numbersFromWords(text, toInt32);
        return true;
    case VrCode::SS:
        mValue = numbersFromWords(text, toInt16);
        return true;
    case VrCode::UL:
        mValue = numbersFromWords(text, toUint32);
        return true;
    case VrCode::US:
        mValue = numbersFromWords(text, toUint16);
        return true;
    default:
        return false;
    }
}

}  // namespace Kdd
