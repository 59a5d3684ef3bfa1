#include "server/dicomweb/store/StoreReport.h"

#include <QJsonDocument>
#include <QJsonObject>
#include <QXmlStreamWriter>

namespace Kdd::DicomWeb
{
namespace
{

const QString kRetrieveUrl = QStringLiteral("00081190");
const QString kSopClass = QStringLiteral("00081150");
const QString kSopInstance = QStringLiteral("00081155");
const QString kFailureReason = QStringLiteral("00081197");
const QString kFailedObjects = QStringLiteral("00081198");
const QString kStoredObjects = QStringLiteral("00081199");
const QString kOtherFailures = QStringLiteral("0008119A");

QJsonObject element(const char* vr, const QJsonArray& values)
{
    return {{QStringLiteral("vr"), QLatin1String(vr)}, {QStringLiteral("Value"), values}};
}

void addText(QJsonObject& object, const QString& key, const char* vr, const QByteArray& text)
{
    if (!text.isEmpty())
        object.insert(key, element(vr, {QString::fromUtf8(text)}));
}

const char* keywordOf(const QString& key)
{
    static const QHash<QString, const char*> kKeywords = {
        {kRetrieveUrl, "RetrieveURL"},
        {kSopClass, "ReferencedSOPClassUID"},
        {kSopInstance, "ReferencedSOPInstanceUID"},
        {kFailureReason, "FailureReason"},
        {kFailedObjects, "FailedSOPSequence"},
        {kStoredObjects, "ReferencedSOPSequence"},
        {kOtherFailures, "OtherFailuresSequence"},
    };
    return kKeywords.value(key);
}

void writeXml(QXmlStreamWriter& xml, const QJsonObject& object)
{
    for (auto it = object.begin(); it != object.end(); ++it) {
        const QJsonObject attribute = it.value().toObject();
        xml.writeStartElement(QStringLiteral("DicomAttribute"));
        xml.writeAttribute(QStringLiteral("tag"), it.key());
        xml.writeAttribute(QStringLiteral("vr"), attribute.value(QLatin1String("vr")).toString());
        xml.writeAttribute(QStringLiteral("keyword"), QLatin1String(keywordOf(it.key())));
        int number = 0;
        for (const QJsonValue& value : attribute.value(QLatin1String("Value")).toArray()) {
            xml.writeStartElement(value.isObject() ? QStringLiteral("Item") : QStringLiteral("Value"));
            xml.writeAttribute(QStringLiteral("number"), QString::number(++number));
            if (value.isObject())
                writeXml(xml, value.toObject());
            else
                xml.writeCharacters(value.toVariant().toString());
            xml.writeEndElement();
        }
        xml.writeEndElement();
    }
}

QByteArray xmlOf(const QJsonObject& object)
{
    QByteArray text;
    QXmlStreamWriter xml(&text);
    xml.writeStartDocument();
    xml.writeStartElement(QStringLiteral("NativeDicomModel"));
    writeXml(xml, object);
    xml.writeEndElement();
    xml.writeEndDocument();
    return text;
}

}  // namespace

int failureReason(ArrivalFault fault)
{
    switch (fault) {
    case ArrivalFault::None:
        return 0;
    case ArrivalFault::OutOfSpace:
    case ArrivalFault::TooLarge:
        return 0xA700;
    case ArrivalFault::NotDicom:
        return 0xC000;
    case ArrivalFault::Mismatch:
        return 0xA900;
    case ArrivalFault::OtherStudy:
        return 0xC001;
    case ArrivalFault::OtherContent:
        return 0x0111;
    case ArrivalFault::NotAllowed:
        return 0x0124;
    case ArrivalFault::Failed:
        break;
    }
    return 0x0110;
}

void StoreReport::add(const ArrivedObject& object)
{
    QJsonObject entry;
    const bool isNamed = !object.sopInstanceUID.isEmpty();
    addText(entry, kSopClass, "UI", isNamed ? object.sopClassUID : QByteArray());
    addText(entry, kSopInstance, "UI", object.sopInstanceUID);
    if (!object.isStored()) {
        mIsOutOfSpace = mIsOutOfSpace || object.fault == ArrivalFault::OutOfSpace;
        mMayComeAgain = mMayComeAgain || mIsOutOfSpace || object.fault == ArrivalFault::Failed;
        entry.insert(kFailureReason, element("US", {failureReason(object.fault)}));
        (isNamed ? mFailed : mOthers).append(entry);
        return;
    }
    addText(entry, kRetrieveUrl, "UR",
            mRoot + "/studies/" + object.studyUID + "/series/" + object.seriesUID + "/instances/" +
                object.image);
    mAreOfOneStudy = mAreOfOneStudy && (mOneStudy.isEmpty() || mOneStudy == object.studyUID);
    mOneStudy = object.studyUID;
    mStored.append(entry);
}

int StoreReport::status(int badStatus) const
{
    if (stored() > 0)
        return failed() > 0 || badStatus != 0 ? 202 : 200;
    if (badStatus != 0)
        return badStatus;
    return mMayComeAgain ? 503 : 409;
}

Http::Response StoreReport::response(Form form, int badStatus) const
{
    QJsonObject report;
    // Only where it leads to all of them.
    const QByteArray study = stored() > 0 && mAreOfOneStudy ? mOneStudy : QByteArray();
    addText(report, kRetrieveUrl, "UR", study.isEmpty() ? study : mRoot + "/studies/" + study);
    if (!mFailed.isEmpty())
        report.insert(kFailedObjects, element("SQ", mFailed));
    if (!mStored.isEmpty())
        report.insert(kStoredObjects, element("SQ", mStored));
    if (!mOthers.isEmpty())
        report.insert(kOtherFailures, element("SQ", mOthers));
    const int code = status(badStatus);
    Http::Response response = form == Form::Xml
                                  ? Http::textResponse(code, "application/dicom+xml", xmlOf(report))
                                  : Http::textResponse(code, "application/dicom+json",
                                                       QJsonDocument(report).toJson(QJsonDocument::Compact));
    if (code == 503)
        response.addHeader("Retry-After", mIsOutOfSpace ? "60" : "10");
    return response;
}

}  // namespace Kdd::DicomWeb
