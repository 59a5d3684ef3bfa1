#include "fuzz/AnswerForms.h"

#include "fuzz/Property.h"

#include <QStringList>
#include <QXmlStreamReader>

#include <algorithm>
#include <cstdio>

namespace Kdd
{
namespace
{

using nlohmann::json;

constexpr const char* kGroups[] = {"Alphabetic", "Ideographic", "Phonetic"};

QString stringOf(const json& value)
{
    return QString::fromUtf8(textOf(value));
}

/// What XML has for characters that it does not know.
QString shownInXml(QString text)
{
    for (QChar& each : text) {
        const ushort unit = each.unicode();
        if ((unit < 0x20 && unit != '\t' && unit != '\n' && unit != '\r') || unit >= 0xfffe)
            each = QChar::ReplacementCharacter;
    }
    return text;
}

class XmlReader
{
public:
    explicit XmlReader(const QByteArray& document)
        : mReader(document)
    {
    }

    void requireSame(const json& object)
    {
        require(mReader.readNextStartElement() && mReader.name() == QLatin1String("NativeDicomModel"),
                "a document has its root");
        attributes(object);
        while (!mReader.atEnd())
            mReader.readNext();
        require(!mReader.hasError(), "XML can be read");
    }

private:
    void attributes(const json& object)
    {
        auto at = object.begin();
        for (; mReader.readNextStartElement(); ++at) {
            require(at != object.end() && mReader.name() == QLatin1String("DicomAttribute"),
                    "XML has the attributes of JSON");
            const QString tag = mReader.attributes().value(QLatin1String("tag")).toString();
            const QString key = QString::fromStdString(at.key());
            require(tag.left(4) == key.left(4) && tag.right(2) == key.right(2), "attributes have their tags");
            require(mReader.attributes().value(QLatin1String("vr")).toString().toStdString() ==
                        at.value()["vr"],
                    "attributes have their VRs");
            values(at.value());
        }
        require(!mReader.hasError(), "XML can be read");
        require(at == object.end(), "XML has all attributes of JSON");
    }

    void values(const json& element)
    {
        const json all = element.value("Value", json::array());
        std::size_t count = 0;
        while (mReader.readNextStartElement()) {
            const QStringRef name = mReader.name();
            if (name == QLatin1String("InlineBinary")) {
                require(mReader.readElementText().toStdString() == element["InlineBinary"],
                        "bytes are the same");
            } else if (name == QLatin1String("BulkData")) {
                require(mReader.attributes().value(QLatin1String("uri")).toString().toStdString() ==
                            element["BulkDataURI"],
                        "addresses are the same");
                mReader.skipCurrentElement();
            } else {
                require(count < all.size(), "XML has no other values than JSON");
                value(name.toString(), all[count++]);
            }
        }
        require(count == all.size(), "XML has the values of JSON");
    }

    void value(const QString& name, const json& expected)
    {
        if (name == QLatin1String("Item")) {
            attributes(expected.is_null() ? json::object() : expected);
        } else if (name == QLatin1String("PersonName")) {
            person(expected.is_null() ? json::object() : expected);
        } else {
            const QString text = mReader.readElementText();
            const bool isNumber = expected.is_number();
            const bool holds =
                isNumber ? text.toDouble() == expected.get<double>() : text == shownInXml(stringOf(expected));
            if (!holds)
                std::fprintf(stderr, "\"%s\" in XML, %s in JSON\n", qPrintable(text),
                             expected.dump().c_str());
            require(holds, "a value in XML is the same as in JSON");
        }
    }

    void person(const json& expected)
    {
        QStringList wanted;
        QStringList found;
        for (const char* const group : kGroups) {
            const QStringList components =
                stringOf(expected.value(group, "")).split(QLatin1Char('^')).mid(0, 5);
            for (const QString& each : components)
                if (!each.isEmpty())
                    wanted << shownInXml(each);
        }
        while (mReader.readNextStartElement()) {
            while (mReader.readNextStartElement())
                found << mReader.readElementText();
        }
        if (wanted != found)
            std::fprintf(stderr, "\"%s\" in XML, %s in JSON\n", qPrintable(found.join(QLatin1Char('|'))),
                         expected.dump().c_str());
        require(wanted == found, "a name in XML is the same as in JSON");
    }

    QXmlStreamReader mReader;
};

/// Of which spaces at the ends do not count.
QStringList partsOf(const QString& text)
{
    QStringList parts = text.split(QLatin1Char('\\'));
    for (QString& each : parts)
        each = each.trimmed();
    return parts;
}

json comparable(json value)
{
    if (value.is_object()) {
        value.erase("00080005");
        for (auto at = value.begin(); at != value.end();)
            at = at.value().is_object() && at.value().contains("BulkDataURI") ? value.erase(at)
                                                                              : std::next(at);
    }
    if (value.is_structured())
        for (json& each : value)
            each = comparable(each);
    return value;
}

bool isEqual(const json& a, const json& b)
{
    if (a.is_number() && b.is_number())
        return a.get<double>() == b.get<double>();
    if (!a.is_structured() || a.type() != b.type() || a.size() != b.size())
        return a == b;
    auto other = b.begin();
    for (auto at = a.begin(); at != a.end(); ++at, ++other)
        if ((a.is_object() && at.key() != other.key()) || !isEqual(*at, *other))
            return false;
    return true;
}

}  // namespace

json readJson(const QByteArray& text)
{
    const bool isJson = json::accept(text.cbegin(), text.cend());
    if (!isJson)
        std::fprintf(stderr, "%s\n", text.constData());
    require(isJson, "JSON can be read");
    return json::parse(text.cbegin(), text.cend());
}

DcmTagKey keyOf(const QByteArray& digits)
{
    const uint number = digits.toUInt(nullptr, 16);
    return {static_cast<Uint16>(number >> 16U), static_cast<Uint16>(number & 0xffffU)};
}

QByteArray textOf(const json& value)
{
    if (value.is_string())
        return QByteArray::fromStdString(value.get<std::string>());
    if (value.is_null())
        return {};
    if (!value.is_object())
        return QByteArray::fromStdString(value.dump());
    QByteArray name;
    for (const char* const group : kGroups)
        name += (group == kGroups[0] ? "" : "=") + textOf(value.value(group, json("")));
    while (name.endsWith('='))
        name.chop(1);
    return name;
}

bool isSame(const json& a, const json& b)
{
    const bool isThat = isEqual(comparable(a), comparable(b));
    if (!isThat)
        std::fprintf(stderr, "%s is not %s\n", a.dump().c_str(), b.dump().c_str());
    return isThat;
}

QVector<QByteArray> partsOf(const QByteArray& contentType, const QByteArray& body)
{
    const QByteArray mark = "--" + contentType.mid(contentType.indexOf("boundary=") + 9);
    QVector<QByteArray> parts;
    for (int at = body.indexOf(mark); at >= 0 && body.mid(at + mark.size(), 2) != "--";) {
        const int begin = body.indexOf("\r\n\r\n", at) + 4;
        const int next = body.indexOf("\r\n" + mark, begin);
        require(begin > 3 && next >= 0, "parts have an end");
        parts.append(body.mid(begin, next - begin));
        at = next + 2;
    }
    return parts;
}

void requireSameXml(const QByteArray& document, const json& object)
{
    XmlReader(document).requireSame(object);
}

void requireSameTree(const json& attributes, const json& object)
{
    std::size_t count = 0;
    for (const json& attribute : attributes) {
        std::string key = attribute["tag"];
        std::transform(key.begin(), key.end(), key.begin(), ::toupper);
        if (attribute.value("hidden", false))
            continue;
        require(object.contains(key), "the browser shows what metadata have");
        ++count;
        const json& element = object[key];
        const json values = element.value("Value", json::array());
        const std::string vr = element["vr"];
        if (vr == "SQ" || vr == "AT" || vr == "SV" || vr == "UV" || !attribute.contains("value") ||
            key == "00080005" || attribute.contains("length"))
            continue;
        const bool isText =
            std::all_of(values.begin(), values.end(), [](const json& each) { return !each.is_number(); });
        if (values.empty() || !isText)
            continue;
        // Of a name there are three groups at most.
        const QString shown = QString::fromStdString(attribute["value"]);
        if (vr == "PN" && shown.count(QLatin1Char('=')) > 2)
            continue;
        QStringList wanted;
        for (const json& each : values)
            wanted << stringOf(each);
        const bool holds = partsOf(wanted.join(QLatin1Char('\\'))) == partsOf(shown);
        if (!holds)
            std::fprintf(stderr, "%s is %s in the browser, %s in metadata\n", key.c_str(),
                         attribute.dump().c_str(), values.dump().c_str());
        require(holds, "the browser shows what metadata show");
    }
    require(count + (object.contains("00080005") ? 1 : 0) >= object.size(),
            "the browser shows all attributes");
}

}  // namespace Kdd
