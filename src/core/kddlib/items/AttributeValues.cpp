#include "kddlib/items/AttributeValues.h"

#include "kddlib/items/KeyDigits.h"

#include <QtEndian>

#include <dcmtk/dcmdata/dcdeftag.h>

#include <algorithm>
#include <charconv>
#include <cmath>
#include <type_traits>

namespace Kdd
{

namespace
{

using Text = std::string_view;

/// How the texts of a VR are to be read.
struct TextRules
{
    Text padding = " ";          // at the end of a value
    bool isPaddedBefore = true;  // and before it
    bool hasValues = true;       // between backslashes
};

TextRules rulesOf(DcmEVR vr)
{
    switch (vr) {
    case EVR_AS:
    case EVR_DA:
    case EVR_DT:
    case EVR_TM:
    case EVR_UC:
        return {" ", false, true};
    case EVR_LT:
    case EVR_ST:
    case EVR_UR:
    case EVR_UT:
        return {" ", false, false};
    case EVR_UI:
        return {Text(" \0", 2), true, true};
    default:
        return {};
    }
}

Text trimmed(Text text, const TextRules& rules)
{
    const std::size_t begin = rules.isPaddedBefore ? text.find_first_not_of(rules.padding) : 0;
    const std::size_t last = text.find_last_not_of(rules.padding);
    return last == Text::npos ? Text() : text.substr(begin, last + 1 - begin);
}

/// What stands before the separator, which is taken off with it.
Text takePart(Text& text, char separator)
{
    const std::size_t end = text.find(separator);
    const Text part = text.substr(0, end);
    text = end == Text::npos ? Text() : text.substr(end + 1);
    return part;
}

/// Up to the next group, and without the separators behind its last component.
Text takeGroup(Text& name)
{
    const Text group = takePart(name, '=');
    const std::size_t last = group.find_last_not_of(" ^");
    return last == Text::npos ? Text() : group.substr(0, last + 1);
}

void appendName(QByteArray& out, const AttributeForm& form, int index, Text name)
{
    NameGroups groups;
    groups.alphabetic = takeGroup(name);
    groups.ideographic = takeGroup(name);
    groups.phonetic = takeGroup(name);
    form.name(out, index, groups);
}

void appendText(QByteArray& out, const AttributeForm& form, DcmEVR vr, int index, Text text)
{
    if (vr == EVR_PN && !text.empty())
        appendName(out, form, index, text);
    else if (vr == EVR_DS || (vr == EVR_IS && text.find_first_not_of("+-0123456789") == Text::npos))
        form.numeral(out, index, text);
    else
        form.text(out, index, text);
}

/// UIDs that somebody has broken into lines are read without the gaps.
QByteArray withoutGaps(const QByteArray& uids)
{
    static const auto isGap = [](char c) { return c == ' ' || (c >= '\t' && c <= '\r'); };
    if (std::none_of(uids.begin(), uids.end(), isGap))
        return uids;
    QByteArray whole = uids;
    whole.truncate(static_cast<int>(std::remove_if(whole.begin(), whole.end(), isGap) - whole.begin()));
    return whole;
}

int appendTexts(QByteArray& out, const AttributeForm& form, DcmEVR vr, const QByteArray& value)
{
    const TextRules rules = rulesOf(vr);
    const Text text(value.constData(), static_cast<std::size_t>(value.size()));
    if (!rules.hasValues) {
        const Text whole = trimmed(text, rules);
        if (!whole.empty())
            appendText(out, form, vr, 0, whole);
        return whole.empty() ? 0 : 1;
    }
    const char* const empty = vr == EVR_PN ? " \\^=" : " \\";
    if (text.find_first_not_of(empty) == Text::npos)
        return 0;
    int count = 0;
    Text left = text;
    for (auto separators = std::count(text.begin(), text.end(), '\\'); separators >= 0; --separators)
        appendText(out, form, vr, count++, trimmed(takePart(left, '\\'), rules));
    return count;
}

constexpr std::size_t kMostDigits = 32;

/// Writes the fewest digits that read back as the very number, which has to be finite; where they end. The exponent has no
/// "+".
template <typename Real>
char* writeReal(char* digits, Real number)
{
    // Where a number is written with an exponent, as everywhere else in texts of DICOM.
    constexpr Real kLeastFixed = Real(1e-4);
    constexpr Real kMostFixed = Real(1e17);
    const Real size = std::fabs(number);
    const bool isFixed = size == 0 || (size >= kLeastFixed && size < kMostFixed);
    const auto format = isFixed ? std::chars_format::fixed : std::chars_format::scientific;
    return std::remove(digits, std::to_chars(digits, digits + kMostDigits, number, format).ptr, '+');
}

/// Programs that read numbers as doubles, as browsers do, would take others for their neighbours.
template <typename Number>
bool isExactAsDouble(Number number)
{
    constexpr double kBound = 9007199254740992;  // 2^53
    return std::fabs(static_cast<double>(number)) < kBound;
}

template <typename Number>
void appendNumber(QByteArray& out, const AttributeForm& form, int index, Number number)
{
    char digits[kMostDigits];
    const char* end = digits;
    if constexpr (std::is_integral_v<Number>) {
        end = std::to_chars(digits, digits + kMostDigits, number).ptr;
        if (!isExactAsDouble(number)) {
            form.text(out, index, {digits, static_cast<std::size_t>(end - digits)});
            return;
        }
    } else if (std::isfinite(number)) {
        end = writeReal(digits, number);
    } else {
        // No digits stand for it; this is what programs take for it.
        form.text(out, index, std::isnan(number) ? "NaN" : number > 0 ? "Infinity" : "-Infinity");
        return;
    }
    form.number(out, index, {digits, static_cast<std::size_t>(end - digits)});
}

template <typename Number>
int appendNumbers(QByteArray& out, const AttributeForm& form, const QByteArray& value)
{
    constexpr int kSize = sizeof(Number);
    const int count = value.size() / kSize;
    for (int i = 0; i < count; ++i)
        appendNumber(out, form, i, qFromUnaligned<Number>(value.constData() + qptrdiff(i) * kSize));
    return count;
}

int appendKeys(QByteArray& out, const AttributeForm& form, const QByteArray& value)
{
    const int count = value.size() / 4;
    for (int i = 0; i < count; ++i) {
        char digits[kKeyDigits];
        const char* const at = value.constData() + qptrdiff(i) * 4;
        writeKeyDigits(digits, {qFromUnaligned<quint16>(at), qFromUnaligned<quint16>(at + 2)});
        form.text(out, i, {digits, kKeyDigits});
    }
    return count;
}

bool isOfPixels(const DcmTagKey& key)
{
    const bool isOverlay = (key.getGroup() & 0xff01) == 0x6000 && key.getElement() == 0x3000;
    return isOverlay || key == DCM_PixelData;
}

/// How many bytes belong together.
int unitOf(const DcmTagKey& key, DcmEVR vr)
{
    switch (vr) {
    case EVR_OD:
    case EVR_OV:
        return 8;
    case EVR_OF:
    case EVR_OL:
        return 4;
    case EVR_OW:
    case EVR_lt:
        return isOfPixels(key) ? 1 : 2;
    default:
        return 1;
    }
}

void appendBytes(QByteArray& out, const AttributeForm& form, const DcmTagKey& key, DcmEVR vr,
                 const QByteArray& value)
{
    QByteArray whole = value;
    if (const int rest = value.size() % unitOf(key, vr); rest != 0)
        whole.chop(rest);
    // As in files.
    if (whole.size() % 2 != 0)
        whole.append('\0');
    if (!whole.isEmpty())
        form.binary(out, whole);
}

/// How many they are; bytes are none by themselves.
// NOLINTNEXTLINE(readability-function-size): a table
int appendValues(QByteArray& out, const AttributeForm& form, const DcmTagKey& key, DcmEVR vr,
                 const QByteArray& value)
{
    switch (vr) {
    case EVR_AT:
        return appendKeys(out, form, value);
    case EVR_FD:
        return appendNumbers<double>(out, form, value);
    case EVR_FL:
        return appendNumbers<float>(out, form, value);
    case EVR_SL:
        return appendNumbers<qint32>(out, form, value);
    case EVR_SS:
        return appendNumbers<qint16>(out, form, value);
    case EVR_SV:
        return appendNumbers<qint64>(out, form, value);
    case EVR_UL:
    case EVR_up:
        return appendNumbers<quint32>(out, form, value);
    case EVR_US:
    case EVR_xs:
        return appendNumbers<quint16>(out, form, value);
    case EVR_UV:
        return appendNumbers<quint64>(out, form, value);
    case EVR_UI:
        return appendTexts(out, form, vr, withoutGaps(value));
    default:
        break;
    }
    if (DcmVR(vr).isaString())
        return appendTexts(out, form, vr, value);
    appendBytes(out, form, key, vr, value);
    return 0;
}

}  // namespace

void appendAttribute(QByteArray& out, const AttributeForm& form, const AttributeName& name, DcmEVR vr,
                     const QByteArray& value)
{
    // Where nobody told how wide pixels are, they are words.
    const bool areWords = (vr == EVR_px || vr == EVR_ox) && isOfPixels(name.key);
    form.beginValues(out, name, areWords ? "OW" : DcmVR(vr).getValidVRName());
    form.endValues(out, appendValues(out, form, name.key, vr, value));
}

}  // namespace Kdd
