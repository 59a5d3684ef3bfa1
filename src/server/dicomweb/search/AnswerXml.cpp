#include "server/dicomweb/search/AnswerXml.h"

#include "server/http/Packing.h"

#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QStringList>
#include <QXmlStreamWriter>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdicent.h>
#include <dcmtk/dcmdata/dcdict.h>
#include <dcmtk/dcmdata/dctag.h>

#include <algorithm>
#include <iterator>

namespace Kdd::DicomWeb
{
namespace
{

constexpr const char* kGroups[] = {"Alphabetic", "Ideographic", "Phonetic"};
constexpr const char* kComponents[] = {"FamilyName", "GivenName", "MiddleName", "NamePrefix", "NameSuffix"};

/// Control characters have no form in XML, not even an escaped one.
QString writable(QString text)
{
    for (QChar& each : text) {
        const ushort unit = each.unicode();
        const bool isControl = unit < 0x20 && unit != '\t' && unit != '\n' && unit != '\r';
        if (isControl || unit == 0xFFFE || unit == 0xFFFF)
            each = QChar::ReplacementCharacter;
    }
    return text;
}

class NativeModel
{
public:
    explicit NativeModel(QByteArray& out)
        : mXml(&out)
    {
        mXml.setCodec("UTF-8");
    }

    void write(const QJsonObject& object)
    {
        mXml.writeStartDocument();
        mXml.writeStartElement(QStringLiteral("NativeDicomModel"));
        mXml.writeAttribute(QStringLiteral("xml:space"), QStringLiteral("preserve"));
        attributes(object);
        mXml.writeEndDocument();
    }

private:
    /// Keys come in the order of their digits, which is that of the tags.
    void attributes(const QJsonObject& object)
    {
        for (auto at = object.begin(); at != object.end(); ++at) {
            mXml.writeStartElement(QStringLiteral("DicomAttribute"));
            name(object, at.key());
            const QJsonObject element = at.value().toObject();
            const QString vr = element.value(QLatin1String("vr")).toString();
            mXml.writeAttribute(QStringLiteral("vr"), vr);
            keyword(at.key());
            content(element, vr);
            mXml.writeEndElement();
        }
    }

    /// A private attribute is named by its creator, where that is known, and not by the block that he happens to have.
    void name(const QJsonObject& object, const QString& key)
    {
        bool isNumber = false;
        const uint number = key.toUInt(&isNumber, 16);
        const bool isPrivate = ((number >> 16) & 1) != 0 && (number & 0xFFFF) > 0xFF;
        const QString block = key.left(4) + QLatin1String("00") + key.mid(4, 2);
        const QString creator =
            isPrivate
                ? object.value(block).toObject().value(QLatin1String("Value")).toArray().first().toString()
                : QString();
        if (creator.isEmpty()) {
            mXml.writeAttribute(QStringLiteral("tag"), key);
            return;
        }
        mXml.writeAttribute(QStringLiteral("tag"), key.left(4) + QLatin1String("00") + key.mid(6));
        mXml.writeAttribute(QStringLiteral("privateCreator"), writable(creator));
    }

    void keyword(const QString& key)
    {
        const uint number = key.toUInt(nullptr, 16);
        const DcmTag tag(static_cast<Uint16>(number >> 16), static_cast<Uint16>(number & 0xFFFF));
        const DcmDictEntry* const entry = dcmDataDict.rdlock().findEntry(tag, nullptr);
        const QString known = entry != nullptr ? QString::fromLatin1(entry->getTagName()) : QString();
        dcmDataDict.rdunlock();
        if (!known.isEmpty() && (tag.getGroup() & 1) == 0)
            mXml.writeAttribute(QStringLiteral("keyword"), known);
    }

    void content(const QJsonObject& element, const QString& vr)
    {
        const QJsonArray values = element.value(QLatin1String("Value")).toArray();
        // An empty one of several has its place.
        for (int i = 0; i < values.size(); ++i) {
            const char* const kind = vr == QLatin1String("SQ")   ? "Item"
                                     : vr == QLatin1String("PN") ? "PersonName"
                                                                 : "Value";
            mXml.writeStartElement(QLatin1String(kind));
            mXml.writeAttribute(QStringLiteral("number"), QString::number(i + 1));
            if (vr == QLatin1String("SQ"))
                attributes(values.at(i).toObject());
            else if (vr == QLatin1String("PN"))
                personName(values.at(i).toObject());
            else
                characters(values.at(i).toVariant().toString());
            mXml.writeEndElement();
        }
        if (element.contains(QLatin1String("InlineBinary")))
            mXml.writeTextElement(QStringLiteral("InlineBinary"),
                                  element.value(QLatin1String("InlineBinary")).toString());
        if (element.contains(QLatin1String("BulkDataURI"))) {
            mXml.writeEmptyElement(QStringLiteral("BulkData"));
            mXml.writeAttribute(QStringLiteral("uri"),
                                writable(element.value(QLatin1String("BulkDataURI")).toString()));
        }
    }

    void personName(const QJsonObject& person)
    {
        for (const char* const group : kGroups) {
            const QString text = person.value(QLatin1String(group)).toString();
            if (text.isEmpty())
                continue;
            mXml.writeStartElement(QLatin1String(group));
            const QStringList components = text.split(QLatin1Char('^'));
            for (int i = 0; i < std::min(components.size(), static_cast<int>(std::size(kComponents))); ++i) {
                if (components.at(i).isEmpty())
                    continue;
                mXml.writeStartElement(QLatin1String(kComponents[i]));
                characters(components.at(i));
                mXml.writeEndElement();
            }
            mXml.writeEndElement();
        }
    }

    /// Whoever reads a carriage return as it is takes it for the end of a line.
    void characters(const QString& text)
    {
        const QStringList lines = writable(text).split(QLatin1Char('\r'));
        for (int i = 0; i < lines.size(); ++i) {
            if (i > 0)
                mXml.writeEntityReference(QStringLiteral("#13"));
            mXml.writeCharacters(lines.at(i));
        }
    }

    QXmlStreamWriter mXml;
};

}  // namespace

QByteArray xmlPart(const QByteArray& json, Http::Packing& parts)
{
    QByteArray document;
    NativeModel(document).write(QJsonDocument::fromJson(json).object());
    return parts.begin({}, kXmlMediaType) + document + parts.end();
}

}  // namespace Kdd::DicomWeb
