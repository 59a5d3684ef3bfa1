#include "kddlib/items/JsonForm.h"

#include "kddlib/items/RealText.h"
#include "kddlib/tagmodel/VrCode.h"

#include <QtEndian>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcelem.h>
#include <dcmtk/dcmdata/dcjson.h>
#include <dcmtk/dcmdata/dctag.h>
#include <dcmtk/ofstd/ofstd.h>

#include <algorithm>
#include <charconv>
#include <cmath>
#include <limits>
#include <sstream>

namespace Kdd
{

namespace
{

// As DCMTK writes them; what is not listed has no short way.
constexpr const char* kTextNames[] = {"AE",    "AS",    nullptr, "CS",    "DA",    "DS",    "DT",    nullptr,
                                      nullptr, "IS",    "LO",    "LT",    nullptr, nullptr, nullptr, "PN",
                                      "SH",    nullptr, nullptr, nullptr, "ST",    "TM",    "UI"};

void appendOpening(QByteArray& out, const DcmTagKey& key, const char* vr)
{
    const char* const digits = "0123456789ABCDEF";
    char text[] = R"(,"00000000":{"vr":"XX")";
    const unsigned int number = (static_cast<unsigned int>(key.getGroup()) << 16) | key.getElement();
    for (int i = 0; i < 8; ++i)
        text[2 + i] = digits[(number >> (28 - 4 * i)) & 15];
    text[19] = vr[0];
    text[20] = vr[1];
    out.append(text, static_cast<int>(sizeof text) - 1);
}

void appendQuoted(QByteArray& out, const char* begin, const char* end)
{
    out.append('"');
    for (const char* at = begin; at != end; ++at) {
        if (*at != '"' && *at != '\\')
            continue;
        out.append(begin, static_cast<int>(at - begin)).append('\\');
        begin = at;
    }
    out.append(begin, static_cast<int>(end - begin)).append('"');
}

bool isDigit(char c)
{
    return c >= '0' && c <= '9';
}

/// Whether spaces at its ends would be taken off.
bool isTrimmed(const char* begin, const char* end)
{
    return begin == end || (*begin != ' ' && end[-1] != ' ');
}

const char* skipDigits(const char* at, const char* end)
{
    while (at != end && isDigit(*at))
        ++at;
    return at;
}

/// Past a number without exponent that needs no change to be one of JSON; null when it is none.
const char* pastInteger(const char* at, const char* end)
{
    if (at != end && *at == '-')
        ++at;
    const char* const first = at;
    at = skipDigits(at, end);
    return at == first || (*first == '0' && at - first > 1) ? nullptr : at;
}

bool isPlainInteger(const char* begin, const char* end)
{
    return pastInteger(begin, end) == end;
}

bool isPlainDecimal(const char* begin, const char* end)
{
    // With more digits it may be beyond every double.
    if (end - begin > std::numeric_limits<double>::max_exponent10)
        return false;
    const char* at = pastInteger(begin, end);
    if (at == nullptr || at == end)
        return at != nullptr;
    return *at == '.' && at + 1 != end && skipDigits(at + 1, end) == end;
}

bool isPlainUid(const char* begin, const char* end)
{
    return std::all_of(begin, end, [](char c) { return c == '.' || isDigit(c); });
}

/// The one group of a name, which is shown as it is.
bool isPlainName(const char* begin, const char* end)
{
    return begin != end && isTrimmed(begin, end) && end[-1] != '^' && std::find(begin, end, '=') == end;
}

bool isPlainPart(VrCode vr, const char* begin, const char* end)
{
    switch (vr) {
    case VrCode::DS:
        return isPlainDecimal(begin, end);
    case VrCode::IS:
        return isPlainInteger(begin, end);
    case VrCode::PN:
        return isPlainName(begin, end);
    case VrCode::UI:
        return begin != end && isPlainUid(begin, end);
    default:
        return begin != end && isTrimmed(begin, end);
    }
}

void appendPart(QByteArray& out, VrCode vr, const char* begin, const char* end)
{
    switch (vr) {
    case VrCode::DS:
    case VrCode::IS:
        out.append(begin, static_cast<int>(end - begin));
        return;
    case VrCode::PN:
        out.append(R"({"Alphabetic":)");
        appendQuoted(out, begin, end);
        out.append('}');
        return;
    default:
        appendQuoted(out, begin, end);
    }
}

bool plainText(QByteArray& out, const DcmTagKey& key, VrCode vr, const QByteArray& text)
{
    const auto number = static_cast<std::size_t>(vr);
    const char* const name = number < std::size(kTextNames) ? kTextNames[number] : nullptr;
    if (name == nullptr)
        return false;
    const int begin = out.size();
    appendOpening(out, key, name);
    const bool isWhole = vr == VrCode::LT || vr == VrCode::ST;
    const char* const end = text.constData() + text.size();
    const char* separator = R"(,"Value":[)";
    for (const char* at = text.constData(); !text.isEmpty();) {
        const char* const partEnd = isWhole ? end : std::find(at, end, '\\');
        if (!isPlainPart(vr, at, partEnd)) {
            out.truncate(begin);
            return false;
        }
        out.append(separator);
        appendPart(out, vr, at, partEnd);
        separator = ",";
        if (partEnd == end)
            break;
        at = partEnd + 1;
    }
    out.append(text.isEmpty() ? "}" : "]}");
    return true;
}

template <typename Number>
bool plainNumbers(QByteArray& out, const DcmTagKey& key, const char* vr, const QByteArray& bytes)
{
    constexpr int kSize = sizeof(Number);
    if (bytes.size() % kSize != 0)
        return false;
    appendOpening(out, key, vr);
    for (int at = 0; at < bytes.size(); at += kSize) {
        char digits[24];
        const auto value = qFromUnaligned<Number>(bytes.constData() + at);
        const auto written = std::to_chars(digits, digits + sizeof digits, value);
        out.append(at == 0 ? R"(,"Value":[)" : ",").append(digits, static_cast<int>(written.ptr - digits));
    }
    out.append(bytes.isEmpty() ? "}" : "]}");
    return true;
}

/// JSON has no number for what is not finite, so that is a string which programs take for one. Bytes behind the last whole
/// value are no value.
template <typename Real>
void appendReals(QByteArray& out, const DcmTagKey& key, const char* vr, const QByteArray& bytes)
{
    constexpr int kSize = sizeof(Real);
    appendOpening(out, key, vr);
    const int end = bytes.size() - bytes.size() % kSize;
    for (int at = 0; at < end; at += kSize) {
        const auto value = qFromUnaligned<Real>(bytes.constData() + at);
        out.append(at == 0 ? R"(,"Value":[)" : ",");
        if (std::isfinite(value))
            appendReal(out, value);
        else
            out.append(std::isnan(value) ? R"("NaN")" : value > 0 ? R"("Infinity")" : R"("-Infinity")");
    }
    out.append(end == 0 ? "}" : "]}");
}

/// A private value of unknown kind. One of odd length would be padded, and a standard attribute may be of a younger VR.
bool plainUnknown(QByteArray& out, const DcmTagKey& key, const QByteArray& bytes)
{
    if ((key.getGroup() & 1) == 0 || bytes.size() % 2 != 0)
        return false;
    appendOpening(out, key, "UN");
    if (!bytes.isEmpty())
        out.append(R"(,"InlineBinary":")").append(bytes.toBase64()).append('"');
    out.append('}');
    return true;
}

/// Moves past the letter of an exponent and the sign behind it, where there is one. Whether it is negative.
bool skipExponentSign(const char*& at, const char* end)
{
    if (at == end || (*at != 'e' && *at != 'E'))
        return false;
    ++at;
    return at != end && (*at == '-' || *at == '+') && *at++ == '-';
}

/// Appends a number of DICOM in the form that JSON has for it: no zeros in front, digits on both sides of the point, and no "+".
/// False, with nothing appended, when it is none, or none that readers can hold. DCMTK leaves the point of "1." and makes "e3"
/// of "0e3".
bool appendNumber(QByteArray& out, const char* at, const char* end)
{
    const bool isNegative = at != end && *at == '-';
    at += at != end && (*at == '-' || *at == '+') ? 1 : 0;
    const char* whole = at;
    const char* const wholeEnd = skipDigits(at, end);
    const char* const fraction = wholeEnd != end && *wholeEnd == '.' ? wholeEnd + 1 : wholeEnd;
    const char* const fractionEnd = fraction != wholeEnd ? skipDigits(fraction, end) : fraction;
    if (whole == wholeEnd && fraction == fractionEnd)
        return false;
    const char* exponent = fractionEnd;
    const bool isSmall = skipExponentSign(exponent, end);
    if (skipDigits(exponent, end) != end || (exponent != fractionEnd && exponent == end))
        return false;
    double value = 0;
    if (std::from_chars(whole, end, value).ec == std::errc::result_out_of_range)
        return false;
    while (wholeEnd - whole > 1 && *whole == '0')
        ++whole;
    out.append(isNegative ? "-" : "").append(whole == wholeEnd ? "0" : "");
    out.append(whole, static_cast<int>(wholeEnd - whole));
    if (fraction != fractionEnd)
        out.append('.').append(fraction, static_cast<int>(fractionEnd - fraction));
    if (exponent != fractionEnd)
        out.append(*fractionEnd)
            .append(isSmall ? "-" : "")
            .append(exponent, static_cast<int>(end - exponent));
    return true;
}

/// What is no number is a text.
void appendDecimals(QByteArray& out, DcmElement& element)
{
    appendOpening(out, element.getTag(), "DS");
    const unsigned long count = element.isEmpty() ? 0 : element.getVM();
    for (unsigned long i = 0; i < count; ++i) {
        OFString text;
        element.getOFString(text, i);
        out.append(i == 0 ? R"(,"Value":[)" : ",");
        if (text.empty()) {
            out.append("null");
        } else if (!appendNumber(out, text.c_str(), text.c_str() + text.size())) {
            std::ostringstream quoted;
            DcmJsonFormat::printString(quoted, text);
            out.append(quoted.str().c_str());
        }
    }
    out.append(count == 0 ? "}" : "]}");
}

}  // namespace

const JsonForm& JsonForm::instance()
{
    static const JsonForm form;
    return form;
}

bool JsonForm::plainValue(QByteArray& out, const DcmTagKey& key, VrCode vr, const QByteArray& bytes) const
{
    switch (vr) {
    case VrCode::FD:
        appendReals<double>(out, key, "FD", bytes);
        return true;
    case VrCode::FL:
        appendReals<float>(out, key, "FL", bytes);
        return true;
    case VrCode::UN:
        return plainUnknown(out, key, bytes);
    case VrCode::SL:
        return plainNumbers<qint32>(out, key, "SL", bytes);
    case VrCode::SS:
        return plainNumbers<qint16>(out, key, "SS", bytes);
    case VrCode::UL:
        return plainNumbers<quint32>(out, key, "UL", bytes);
    case VrCode::US:
        return plainNumbers<quint16>(out, key, "US", bytes);
    default:
        return plainText(out, key, vr, bytes);
    }
}

void JsonForm::element(QByteArray& out, DcmElement& element, const char* /*creator*/) const
{
    if (element.ident() == EVR_DS) {
        appendDecimals(out, element);
        return;
    }
    DcmJsonFormatCompact format(OFFalse);
    std::ostringstream text;
    element.writeJson(text, format);
    const std::string written = text.str();
    out.append(',').append(written.data(), static_cast<int>(written.size()));
}

void JsonForm::beginOmitted(QByteArray& out, const AttributeName& name) const
{
    // The value's own VR went with it.
    appendOpening(out, name.key, DcmVR(dictionaryEvr(name.key)).getValidVRName());
    out.append(R"(,"BulkDataURI":")");
}

void JsonForm::endOmitted(QByteArray& out) const
{
    out.append("\"}");
}

QByteArray JsonForm::addressPart(const QByteArray& text) const
{
    const bool isPlain = std::all_of(text.begin(), text.end(),
                                     [](char c) { return c >= ' ' && c <= '~' && c != '"' && c != '\\'; });
    if (isPlain)
        return text;
    std::ostringstream escaped;
    DcmJsonFormat::escapeControlCharacters(escaped,
                                           OFString(text.constData(), static_cast<size_t>(text.size())));
    return QByteArray::fromStdString(escaped.str());
}

void JsonForm::beginSequence(QByteArray& out, const AttributeName& name) const
{
    appendOpening(out, name.key, "SQ");
}

void JsonForm::endSequence(QByteArray& out, int items) const
{
    out.append(items > 0 ? "]}" : "}");
}

void JsonForm::beginItem(QByteArray& out, int index) const
{
    out.append(index == 0 ? R"(,"Value":[)" : ",");
}

void JsonForm::endItem(QByteArray& out, int begin) const
{
    endImage(out, begin);
}

void JsonForm::beginImage(QByteArray& /*out*/) const
{
    // Its brace takes the place of the first attribute's comma.
}

void JsonForm::endImage(QByteArray& out, int begin) const
{
    if (out.size() == begin)
        out.append('{');
    else
        out[begin] = '{';
    out.append('}');
}

void JsonForm::declareUtf8(QByteArray& out) const
{
    out.append(R"(,"00080005":{"vr":"CS","Value":["ISO_IR 192"]})");
}

}  // namespace Kdd
