#include "server/dimse/QueryAnswer.h"

#include "server/dicomweb/search/AnswerObject.h"

#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QLocale>
#include <QStringList>

#include <dcmtk/dcmdata/dctk.h>

#include <cmath>
#include <limits>
#include <memory>

namespace Kdd::Dimse
{
namespace
{

const char* const kUtf8 = "ISO_IR 192";

const char* levelName(QueryLevel level)
{
    switch (level) {
    case QueryLevel::Patient:
        return "PATIENT";
    case QueryLevel::Study:
        return "STUDY";
    case QueryLevel::Series:
        return "SERIES";
    case QueryLevel::Image:
        break;
    }
    return "IMAGE";
}

QString nameOf(const QJsonObject& name)
{
    QString text = name.value(QLatin1String("Alphabetic")).toString() + QLatin1Char('=') +
                   name.value(QLatin1String("Ideographic")).toString() + QLatin1Char('=') +
                   name.value(QLatin1String("Phonetic")).toString();
    while (text.endsWith(QLatin1Char('=')))
        text.chop(1);
    return text;
}

/// "00100020" as texts of this VR have it.
QString tagOf(const QString& digits)
{
    return QStringLiteral("(%1,%2)").arg(digits.left(4), digits.mid(4));
}

/// Whole numbers without exponent, which their VRs do not take.
QString numberOf(double number)
{
    constexpr double kExact = 9007199254740992;  // beyond it not every whole number is one of these
    const bool isWhole = std::abs(number) <= kExact && number == std::floor(number);
    return isWhole ? QString::number(static_cast<qint64>(number))
                   : QString::number(number, 'g', QLocale::FloatingPointShortest);
}

QString textOf(const QJsonValue& value, DcmEVR vr)
{
    if (value.isObject())
        return nameOf(value.toObject());
    if (value.isDouble())
        return numberOf(value.toDouble());
    return vr == EVR_AT ? tagOf(value.toString()) : value.toString();
}

QByteArray textsOf(const QJsonArray& values, DcmEVR vr)
{
    QStringList texts;
    for (const QJsonValue& value : values)
        texts << textOf(value, vr);
    return texts.join(QLatin1Char('\\')).toUtf8();
}

/// Where VRs are not sent along, values are read by the dictionary's. What that does not know has the VR that was found.
DcmTag tagOf(const DcmTagKey& key, const QJsonObject& element)
{
    const DcmTag known(key);
    const QByteArray vr = element.value(QLatin1String("vr")).toString().toLatin1();
    const bool isKnown = DcmVR(known.getEVR()).isStandard() && known.getEVR() != EVR_UN;
    return vr.size() == 2 && !isKnown ? DcmTag(key, DcmVR(vr.constData())) : known;
}

void fill(DcmItem& item, const QJsonObject& object, const std::vector<QueryKey>& keys);

/// All that an item of the object has.
std::vector<QueryKey> allKeysOf(const QJsonObject& object)
{
    std::vector<QueryKey> keys;
    for (auto each = object.begin(); each != object.end(); ++each) {
        const quint32 number = each.key().toUInt(nullptr, 16);
        keys.push_back(
            {DcmTagKey(static_cast<Uint16>(number >> 16), static_cast<Uint16>(number & 0xFFFF)), {}});
    }
    return keys;
}

void addItems(DcmItem& item, const DcmTag& tag, const QJsonArray& values, const std::vector<QueryKey>& keys)
{
    auto sequence = std::make_unique<DcmSequenceOfItems>(tag);
    for (const QJsonValue& value : values) {
        const QJsonObject object = value.toObject();
        auto made = std::make_unique<DcmItem>();
        fill(*made, object, keys.empty() ? allKeysOf(object) : keys);
        if (sequence->append(made.get()).good())
            static_cast<void>(made.release());
    }
    if (item.insert(sequence.get(), OFTrue).good())
        static_cast<void>(sequence.release());
}

/// JSON has texts for what is not finite.
double realOf(const QJsonValue& value)
{
    using Limits = std::numeric_limits<double>;
    const QString text = value.toString();
    if (text == QLatin1String("Infinity") || text == QLatin1String("-Infinity"))
        return text.startsWith(QLatin1Char('-')) ? -Limits::infinity() : Limits::infinity();
    return text == QLatin1String("NaN") ? Limits::quiet_NaN() : value.toDouble();
}

/// Not as texts, of which DCMTK reads some a little off, and does not take what is not finite.
void putReals(DcmElement& element, const QJsonArray& values)
{
    for (int i = 0; i < values.size(); ++i) {
        const double number = realOf(values.at(i));
        if (element.getVR() == EVR_FD)
            element.putFloat64(number, static_cast<unsigned long>(i));
        else
            element.putFloat32(static_cast<Float32>(number), static_cast<unsigned long>(i));
    }
}

void addValue(DcmItem& item, const QueryKey& key, const QJsonObject& element)
{
    const DcmTag tag = tagOf(key.key, element);
    const QJsonArray values = element.value(QLatin1String("Value")).toArray();
    if (tag.getEVR() == EVR_SQ) {
        const bool hasItems = element.value(QLatin1String("vr")).toString() == QLatin1String("SQ");
        addItems(item, tag, hasItems ? values : QJsonArray(), key.items);
        return;
    }
    DcmElement* made = nullptr;
    // Pixels without value DCMTK writes in items as it cannot read them.
    if (key.key == DCM_PixelData)
        made = new DcmOtherByteOtherWord(DcmTag(key.key, EVR_OW));
    else if (DcmItem::newDicomElementWithVR(made, tag).bad())
        return;
    // Where the text is none of its VR the element stays without value.
    const QByteArray text = textsOf(values, tag.getEVR());
    if (tag.getEVR() == EVR_FD || tag.getEVR() == EVR_FL)
        putReals(*made, values);
    else if (!text.isEmpty())
        made->putString(text.constData());
    if (item.insert(made, OFTrue).bad())
        delete made;
}

void fill(DcmItem& item, const QJsonObject& object, const std::vector<QueryKey>& keys)
{
    for (const QueryKey& key : keys)
        addValue(item, key, object.value(QLatin1String(DicomWeb::keyName(key.key))).toObject());
}

}  // namespace

void fillAnswer(const QueryIdentifier& question, const QByteArray& json, const QByteArray& title,
                DcmDataset& answer)
{
    const QJsonObject object = QJsonDocument::fromJson(json).object();
    std::vector<QueryKey> keys;
    for (const QueryKey& key : question.keys) {
        if (question.shows(key.key))
            keys.push_back(key);
    }
    fill(answer, object, keys);
    if (answer.tagExists(DCM_RetrieveAETitle))
        answer.putAndInsertString(DCM_RetrieveAETitle, title.constData());
    answer.putAndInsertString(DCM_QueryRetrieveLevel, levelName(question.level));
    answer.putAndInsertString(DCM_SpecificCharacterSet, kUtf8);
}

}  // namespace Kdd::Dimse
