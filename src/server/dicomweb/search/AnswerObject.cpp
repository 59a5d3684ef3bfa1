#include "server/dicomweb/search/AnswerObject.h"

#include <QJsonArray>
#include <QJsonDocument>

#include <algorithm>
#include <charconv>

namespace Kdd::DicomWeb
{
namespace
{

constexpr int kNameSize = 8;
constexpr int kHexadecimal = 16;

std::string_view view(const QByteArray& bytes)
{
    return {bytes.constData(), static_cast<std::size_t>(bytes.size())};
}

/// Of eight hexadecimal digits; false when there is something else.
bool readNumber(std::string_view name, AttributeNumber& number)
{
    const auto read = std::from_chars(name.data(), name.data() + kNameSize, number, kHexadecimal);
    return read.ec == std::errc() && read.ptr == name.data() + kNameSize;
}

void writeNumber(AttributeNumber number, char* digits)
{
    static const char kDigits[] = "0123456789ABCDEF";
    for (int i = kNameSize - 1; i >= 0; --i, number >>= 4)
        digits[i] = kDigits[number & 0xF];
}

/// Calls `take(element)` for each line.
template <typename Take>
void forEachLine(const QByteArray& lines, const Take& take)
{
    std::string_view rest = view(lines);
    while (!rest.empty()) {
        const std::string_view line = rest.substr(0, rest.find('\n'));
        AttributeNumber number = 0;
        if (line.size() > kNameSize && readNumber(line, number))
            take(AnswerObject::Element{number, line.substr(kNameSize)});
        rest.remove_prefix(std::min(rest.size(), line.size() + 1));
    }
}

/// Where the value that begins at `at` ends: at the comma or brace behind it.
int endOfValue(const QByteArray& json, int at)
{
    int depth = 0;
    bool isText = false;
    for (; at < json.size(); ++at) {
        const char each = json.at(at);
        if (isText) {
            at += each == '\\' ? 1 : 0;
            isText = each != '"';
        } else if (each == '"') {
            isText = true;
        } else if (each == '{' || each == '[') {
            ++depth;
        } else if (each == '}' || each == ']') {
            if (depth-- == 0)
                return at;
        } else if (each == ',' && depth == 0) {
            return at;
        }
    }
    return at;
}

}  // namespace

AttributeNumber numberOf(const DcmTagKey& key)
{
    return (quint32(key.getGroup()) << 16) | key.getElement();
}

QByteArray keyName(const DcmTagKey& key)
{
    QByteArray name(kNameSize, Qt::Uninitialized);
    writeNumber(numberOf(key), name.data());
    return name;
}

QByteArray elementOf(const QByteArray& lines, const DcmTagKey& key)
{
    QByteArray found;
    forEachLine(lines, [&, wanted = numberOf(key)](const AnswerObject::Element& each) {
        if (each.attribute == wanted)
            found = QByteArray(each.text.data(), static_cast<int>(each.text.size()));
    });
    return found;
}

void AnswerObject::add(const Element& element)
{
    const bool isThere = std::any_of(mElements.begin(), mElements.end(), [&](const Element& each) {
        return each.attribute == element.attribute;
    });
    if (!isThere)
        mElements.push_back(element);
}

void AnswerObject::add(AttributeNumber attribute, QByteArray text)
{
    // The view is of bytes that do not move with the array.
    mOwned.push_back(std::move(text));
    add({attribute, view(qAsConst(mOwned.back()))});
}

void AnswerObject::addText(AttributeNumber attribute, const char* vr, const QByteArray& value)
{
    add(attribute, QByteArray("{\"vr\":\"") + vr + "\",\"Value\":[" + jsonText(value) + "]}");
}

void AnswerObject::addNumber(AttributeNumber attribute, int value)
{
    add(attribute, "{\"vr\":\"IS\",\"Value\":[" + QByteArray::number(value) + "]}");
}

void AnswerObject::addLines(const QByteArray& lines, const std::vector<AttributeNumber>& attributes)
{
    forEachLine(lines, [&](const Element& each) {
        if (std::binary_search(attributes.begin(), attributes.end(), each.attribute))
            add(each);
    });
}

void AnswerObject::addAllLines(const QByteArray& lines)
{
    forEachLine(lines, [&](const Element& each) { add(each); });
}

void AnswerObject::addObject(const QByteArray& json)
{
    // {"GGGGEEEE":{...},"GGGGEEEE":{...}}
    constexpr int kBeforeValue = kNameSize + 3;
    mOwned.push_back(json);
    const std::string_view all = view(qAsConst(mOwned.back()));
    for (int at = json.indexOf('"'); at > 0 && at + kBeforeValue < json.size(); at = json.indexOf('"', at)) {
        const int end = endOfValue(json, at + kBeforeValue);
        const auto value = static_cast<std::size_t>(at + kBeforeValue);
        AttributeNumber number = 0;
        if (readNumber(all.substr(static_cast<std::size_t>(at) + 1), number))
            add({number, all.substr(value, static_cast<std::size_t>(end) - value)});
        at = end;
    }
}

void AnswerObject::write(QByteArray& out)
{
    std::sort(mElements.begin(), mElements.end(),
              [](const Element& a, const Element& b) { return a.attribute < b.attribute; });
    char before[] = ",\"GGGGEEEE\":";
    out += '{';
    for (std::size_t i = 0; i < mElements.size(); ++i) {
        writeNumber(mElements[i].attribute, before + 2);
        out.append(i == 0 ? before + 1 : before);
        out.append(mElements[i].text.data(), static_cast<int>(mElements[i].text.size()));
    }
    out += '}';
}

QByteArray jsonText(const QByteArray& text)
{
    // Nearly all: what stands for itself.
    const bool isPlain = std::all_of(text.begin(), text.end(), [](char each) {
        return each >= ' ' && each < '\x7f' && each != '"' && each != '\\';
    });
    if (isPlain)
        return '"' + text + '"';
    const QByteArray array =
        QJsonDocument(QJsonArray{QString::fromUtf8(text)}).toJson(QJsonDocument::Compact);
    return array.mid(1, array.size() - 2);
}

}  // namespace Kdd::DicomWeb
