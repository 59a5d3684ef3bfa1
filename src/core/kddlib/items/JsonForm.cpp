#include "kddlib/items/JsonForm.h"

#include "kddlib/items/KeyDigits.h"

#include <algorithm>
#include <charconv>
#include <limits>

namespace Kdd
{

namespace
{

using Text = std::string_view;

void append(QByteArray& out, Text text)
{
    out.append(text.data(), static_cast<int>(text.size()));
}

/// The letter of the short escape, where JSON has one.
char shortEscape(char c)
{
    switch (c) {
    case '"':
    case '\\':
        return c;
    case '\b':
        return 'b';
    case '\f':
        return 'f';
    case '\n':
        return 'n';
    case '\r':
        return 'r';
    case '\t':
        return 't';
    default:
        return '\0';
    }
}

void appendEscape(QByteArray& out, char c)
{
    out.append('\\');
    if (const char letter = shortEscape(c); letter != '\0')
        out.append(letter);
    else
        out.append("u00").append(c < 0x10 ? '0' : '1').append("0123456789abcdef"[c & 15]);
}

bool isEscaped(char c)
{
    return (c >= '\0' && c < ' ') || c == '"' || c == '\\';
}

void appendEscaped(QByteArray& out, Text text)
{
    const char* begin = text.data();
    const char* const end = begin + text.size();
    for (const char* at = begin; at != end; ++at) {
        if (!isEscaped(*at))
            continue;
        out.append(begin, static_cast<int>(at - begin));
        appendEscape(out, *at);
        begin = at + 1;
    }
    out.append(begin, static_cast<int>(end - begin));
}

void appendQuoted(QByteArray& out, Text text)
{
    out.append('"');
    appendEscaped(out, text);
    out.append('"');
}

void beginValue(QByteArray& out, int index)
{
    out.append(index == 0 ? R"(,"Value":[)" : ",");
}

void appendOpening(QByteArray& out, const DcmTagKey& key, const char* vr)
{
    char text[] = R"(,"00000000":{"vr":"XX")";
    writeKeyDigits(text + 2, key);
    text[19] = vr[0];
    text[20] = vr[1];
    out.append(text, static_cast<int>(sizeof text) - 1);
}

const char* skipDigits(const char* at, const char* end)
{
    return std::find_if(at, end, [](char c) { return c < '0' || c > '9'; });
}

/// Moves past the letter of an exponent and the sign behind it, where there is one. Whether it is negative.
bool skipExponentSign(const char*& at, const char* end)
{
    if (at == end || (*at != 'e' && *at != 'E'))
        return false;
    ++at;
    return at != end && (*at == '-' || *at == '+') && *at++ == '-';
}

/// Readers refuse a whole answer because of one number that no double can hold.
bool fitsDouble(const char* at, const char* end, bool hasExponent)
{
    if (!hasExponent && end - at <= std::numeric_limits<double>::max_exponent10)
        return true;
    double value = 0;
    return std::from_chars(at, end, value).ec != std::errc::result_out_of_range;
}

/// Appends a number of DICOM in the form that JSON has for it: no zeros in front, digits on both sides of the point, and no "+".
/// False, with nothing appended, when it is none, or none that readers can hold.
bool appendNumber(QByteArray& out, Text text)
{
    const char* at = text.data();
    const char* const end = at + text.size();
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
    const bool hasExponent = exponent != fractionEnd;
    if (skipDigits(exponent, end) != end || (hasExponent && exponent == end))
        return false;
    if (!fitsDouble(whole, end, hasExponent))
        return false;
    while (wholeEnd - whole > 1 && *whole == '0')
        ++whole;
    out.append(isNegative ? "-" : "").append(whole == wholeEnd ? "0" : "");
    out.append(whole, static_cast<int>(wholeEnd - whole));
    if (fraction != fractionEnd)
        out.append('.').append(fraction, static_cast<int>(fractionEnd - fraction));
    if (hasExponent)
        out.append(*fractionEnd)
            .append(isSmall ? "-" : "")
            .append(exponent, static_cast<int>(end - exponent));
    return true;
}

}  // namespace

const JsonForm& JsonForm::instance()
{
    static const JsonForm form;
    return form;
}

void JsonForm::beginValues(QByteArray& out, const AttributeName& name, const char* vr) const
{
    appendOpening(out, name.key, vr);
}

void JsonForm::endValues(QByteArray& out, int count) const
{
    out.append(count > 0 ? "]}" : "}");
}

void JsonForm::text(QByteArray& out, int index, Text text) const
{
    beginValue(out, index);
    if (text.empty())
        out.append("null");
    else
        appendQuoted(out, text);
}

void JsonForm::name(QByteArray& out, int index, const NameGroups& groups) const
{
    beginValue(out, index);
    char separator = '{';
    const auto append = [&](const char* form, Text group) {
        if (group.empty())
            return;
        out.append(separator).append('"').append(form).append("\":");
        appendQuoted(out, group);
        separator = ',';
    };
    append("Alphabetic", groups.alphabetic);
    append("Ideographic", groups.ideographic);
    append("Phonetic", groups.phonetic);
    out.append(separator == ',' ? "}" : "null");
}

void JsonForm::numeral(QByteArray& out, int index, Text text) const
{
    beginValue(out, index);
    if (text.empty())
        out.append("null");
    else if (!appendNumber(out, text))
        appendQuoted(out, text);
}

void JsonForm::number(QByteArray& out, int index, Text digits) const
{
    beginValue(out, index);
    append(out, digits);
}

void JsonForm::binary(QByteArray& out, const QByteArray& bytes) const
{
    out.append(R"(,"InlineBinary":")").append(bytes.toBase64()).append('"');
}

void JsonForm::beginAddress(QByteArray& out) const
{
    out.append(R"(,"BulkDataURI":")");
}

void JsonForm::endAddress(QByteArray& out) const
{
    out.append('"');
}

QByteArray JsonForm::addressPart(const QByteArray& text) const
{
    QByteArray escaped;
    appendEscaped(escaped, {text.constData(), static_cast<std::size_t>(text.size())});
    return escaped;
}

void JsonForm::beginSequence(QByteArray& out, const AttributeName& name) const
{
    appendOpening(out, name.key, "SQ");
}

void JsonForm::endSequence(QByteArray& out, int items) const
{
    endValues(out, items);
}

void JsonForm::beginItem(QByteArray& out, int index) const
{
    beginValue(out, index);
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
