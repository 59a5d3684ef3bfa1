#include "server/dicomweb/search/AnswerObject.h"

#include <QJsonArray>
#include <QJsonDocument>

#include <algorithm>

namespace Kdd::DicomWeb
{
namespace
{

constexpr int kNameSize = 8;

/// Calls `take(name, element)` for each line.
template <typename Take>
void forEachLine(const QByteArray& lines, const Take& take)
{
    for (int at = 0; at < lines.size();) {
        const int end = lines.indexOf('\n', at);
        const int stop = end < 0 ? lines.size() : end;
        if (stop - at > kNameSize)
            take(lines.mid(at, kNameSize), lines.mid(at + kNameSize, stop - at - kNameSize));
        at = stop + 1;
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

QByteArray keyName(const DcmTagKey& key)
{
    const quint32 number = (quint32(key.getGroup()) << 16) | key.getElement();
    return QByteArray::number(number, 16).toUpper().rightJustified(kNameSize, '0');
}

QByteArray elementOf(const QByteArray& lines, const QByteArray& name)
{
    QByteArray found;
    forEachLine(lines, [&](const QByteArray& each, const QByteArray& element) {
        if (each == name)
            found = element;
    });
    return found;
}

void AnswerObject::add(const QByteArray& name, const QByteArray& element)
{
    const bool isThere =
        std::any_of(mElements.begin(), mElements.end(), [&](const auto& each) { return each.first == name; });
    if (!isThere)
        mElements.emplace_back(name, element);
}

void AnswerObject::addText(const QByteArray& name, const char* vr, const QByteArray& value)
{
    add(name, QByteArray("{\"vr\":\"") + vr + "\",\"Value\":[" + jsonText(value) + "]}");
}

void AnswerObject::addNumber(const QByteArray& name, int value)
{
    add(name, "{\"vr\":\"IS\",\"Value\":[" + QByteArray::number(value) + "]}");
}

void AnswerObject::addLines(const QByteArray& lines, const std::vector<QByteArray>& names)
{
    forEachLine(lines, [&](const QByteArray& name, const QByteArray& element) {
        if (std::find(names.begin(), names.end(), name) != names.end())
            add(name, element);
    });
}

void AnswerObject::addAllLines(const QByteArray& lines)
{
    forEachLine(lines, [&](const QByteArray& name, const QByteArray& element) { add(name, element); });
}

void AnswerObject::addObject(const QByteArray& json)
{
    // {"GGGGEEEE":{...},"GGGGEEEE":{...}}
    constexpr int kBeforeValue = kNameSize + 3;
    for (int at = json.indexOf('"'); at > 0 && at + kBeforeValue < json.size(); at = json.indexOf('"', at)) {
        const int end = endOfValue(json, at + kBeforeValue);
        add(json.mid(at + 1, kNameSize), json.mid(at + kBeforeValue, end - at - kBeforeValue));
        at = end;
    }
}

void AnswerObject::addMissing(const std::vector<std::pair<QByteArray, const char*>>& names)
{
    for (const auto& each : names)
        add(each.first, QByteArray("{\"vr\":\"") + each.second + "\"}");
}

void AnswerObject::write(QByteArray& out)
{
    std::sort(mElements.begin(), mElements.end(),
              [](const auto& a, const auto& b) { return a.first < b.first; });
    out += '{';
    bool isFirst = true;
    for (const auto& each : mElements) {
        if (!isFirst)
            out += ',';
        isFirst = false;
        out += '"' + each.first + "\":" + each.second;
    }
    out += '}';
}

QByteArray jsonText(const QByteArray& text)
{
    const QByteArray array =
        QJsonDocument(QJsonArray{QString::fromUtf8(text)}).toJson(QJsonDocument::Compact);
    return array.mid(1, array.size() - 2);
}

}  // namespace Kdd::DicomWeb
