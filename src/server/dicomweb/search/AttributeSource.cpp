#include "server/dicomweb/search/AttributeSource.h"

#include "server/dicomweb/search/AnswerObject.h"

#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QtEndian>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <kddlib/TagMap.h>
#include <kddlib/TagSequence.h>
#include <kddlib/TextDecoding.h>

#include <charconv>

namespace Kdd::DicomWeb
{
namespace
{

QString textOf(const QJsonValue& value)
{
    if (!value.isObject())
        return value.toVariant().toString();
    const QJsonObject name = value.toObject();
    QString text = name.value(QLatin1String("Alphabetic")).toString() + QLatin1Char('=') +
                   name.value(QLatin1String("Ideographic")).toString() + QLatin1Char('=') +
                   name.value(QLatin1String("Phonetic")).toString();
    while (text.endsWith(QLatin1Char('=')))
        text.chop(1);
    return text;
}

void collect(const QJsonObject& element, const QVector<DcmTagKey>& path, int depth, QStringList& values)
{
    const QJsonArray list = element.value(QLatin1String("Value")).toArray();
    for (const QJsonValue& value : list) {
        if (depth + 1 == path.size())
            values.append(textOf(value).trimmed());
        else
            collect(value.toObject().value(QLatin1String(keyName(path.at(depth + 1)))).toObject(), path,
                    depth + 1, values);
    }
}

bool hasOneValueOnly(VrCode vr)
{
    return vr == VrCode::LT || vr == VrCode::ST || vr == VrCode::UT;
}

/// With all their digits, as answers have them: who asks for what he was shown finds it.
template <typename Real>
void appendReals(const QByteArray& bytes, QStringList& values)
{
    constexpr int kSize = sizeof(Real);
    for (int at = 0; at + kSize <= bytes.size(); at += kSize) {
        char digits[32];
        const auto written =
            std::to_chars(digits, digits + sizeof digits, qFromLittleEndian<Real>(bytes.constData() + at));
        values.append(QString::fromLatin1(digits, static_cast<int>(written.ptr - digits)));
    }
}

/// By their digits alone, likewise.
void appendTags(const QByteArray& bytes, QStringList& values)
{
    for (int at = 0; at + 4 <= bytes.size(); at += 4)
        values.append(QString::fromLatin1(keyName({qFromLittleEndian<quint16>(bytes.constData() + at),
                                                   qFromLittleEndian<quint16>(bytes.constData() + at + 2)})));
}

void collect(const TagMap& map, const QVector<DcmTagKey>& path, int depth, const QByteArray& characterSet,
             QStringList& values)
{
    const TagElement* element = map.findElement(path.at(depth));
    if (element == nullptr || element->markedAsOmitted())
        return;
    if (depth + 1 < path.size()) {
        if (!element->isSequence())
            return;
        const auto& sequence = static_cast<const TagSequence&>(*element);
        for (int i = 0; i < sequence.numItems(); ++i)
            collect(sequence.itemToRead(i), path, depth + 1, characterSet, values);
        return;
    }
    if (element->vr() == VrCode::FD) {
        appendReals<double>(element->value(), values);
        return;
    }
    if (element->vr() == VrCode::FL) {
        appendReals<float>(element->value(), values);
        return;
    }
    if (element->vr() == VrCode::AT) {
        appendTags(element->value(), values);
        return;
    }
    QByteArray bytes;
    map.findAndGetString(path.at(depth), bytes);
    const QString text = decodeText(bytes, characterSet);
    if (hasOneValueOnly(element->vr())) {
        values.append(text.trimmed());
        return;
    }
    for (const QString& value : text.split(QLatin1Char('\\')))
        values.append(value.trimmed());
}

}  // namespace

QStringList KeptAttributes::values(const QVector<DcmTagKey>& path) const
{
    QStringList values;
    const QByteArray element = elementOf(mLines, path.front());
    if (!element.isEmpty())
        collect(QJsonDocument::fromJson(element).object(), path, 0, values);
    return values;
}

QStringList ImageAttributes::values(const QVector<DcmTagKey>& path) const
{
    QByteArray characterSet;
    mImage.findAndGetString(DCM_SpecificCharacterSet, characterSet);
    QStringList values;
    collect(mImage, path, 0, characterSet, values);
    return values;
}

}  // namespace Kdd::DicomWeb
