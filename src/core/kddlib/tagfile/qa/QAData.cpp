#include "kddlib/tagfile/qa/QAData.h"

#include "kddlib/Limits.h"
#include "kddlib/tagfile/qa/QAEditor.h"
#include "platform/base/LogFile.h"

#include <QXmlStreamReader>

#include <dcmtk/dcmdata/dcdeftag.h>

namespace Kdd
{

namespace
{

/// Reads one job. Faults become errors of the XML reader, which knows the line.
class JobReader
{
public:
    /// Of bytes the declaration in the XML says how they are encoded; a text is none any more, whatever it says.
    template <typename Xml>
    explicit JobReader(const Xml& xml)
        : mXml(xml)
    {
    }

    bool read()
    {
        while (!mXml.atEnd() && !mXml.hasError()) {
            switch (mXml.readNext()) {
            case QXmlStreamReader::DTD:
                // Entities of the job's own are of no use to it, but can make gigabytes of a few lines.
                raise(QStringLiteral("A document type is not accepted"));
                break;
            case QXmlStreamReader::StartElement:
                readElement();
                break;
            default:
                break;
            }
        }
        requireValue();
        // For the last Tag; the others are asked when the next one begins.
        return !mXml.hasError();
    }

    QString fault() const
    {
        return QStringLiteral("Line %1: %2").arg(mXml.lineNumber()).arg(mXml.errorString());
    }

    const QAData& job() const { return mJob; }

private:
    /// The first fault is the one that is told.
    void raise(const QString& fault)
    {
        if (!mXml.hasError())
            mXml.raiseError(fault);
    }

    void readElement()
    {
        const QStringRef name = mXml.name();
        if (name == QLatin1String("Timestamp"))
            readTimestamp();
        else if (name == QLatin1String("Login"))
            readLogin();
        else if (name == QLatin1String("Substitutions"))
            readOldStudy();
        else if (name == QLatin1String("Tag"))
            readTag();
        else if (name == QLatin1String("Value"))
            readValue();
    }

    void readTimestamp()
    {
        const QString text = mXml.readElementText();
        // As it stands, for the images keep it so.
        mJob.timestamp = text.toLatin1();
        QString time;
        if (!auditTime(mJob.timestamp, time))
            raise(QStringLiteral("Timestamp \"%1\" is no time of the form yyyyMMddhhmmss").arg(text));
    }

    void readLogin()
    {
        const QString text = mXml.readElementText().trimmed();
        mJob.login = text.toLatin1();
        if (QString::fromLatin1(mJob.login) != text || !isOneLine(text))
            raise(QStringLiteral("Login \"%1\" is not one line of Latin-1 characters").arg(text));
    }

    void readOldStudy()
    {
        const QByteArray uid = mXml.attributes().value(QLatin1String("OldSUID")).toUtf8();
        // An OldSUID without text names no study, so it does not speak against another one.
        if (!mJob.oldStudyUID.isEmpty() && !uid.isEmpty() && uid != mJob.oldStudyUID)
            raise(QStringLiteral("OldSUID names a second study, \"%1\"").arg(QString::fromUtf8(uid)));
        if (!uid.isEmpty())
            mJob.oldStudyUID = uid;
    }

    quint16 number(const char* attribute)
    {
        const QString text = mXml.attributes().value(QLatin1String(attribute)).toString();
        bool isNumber = false;
        const quint16 value = text.toUShort(&isNumber, 16);
        if (!isNumber)
            raise(QStringLiteral("%1 \"%2\" of a Tag is no hexadecimal number of 16 bits")
                      .arg(QLatin1String(attribute), text));
        return value;
    }

    void readTag()
    {
        requireValue();
        const quint16 group = number("Group");
        const quint16 element = number("Element");
        const DcmTagKey key(group, element);
        for (const QASubstitution& earlier : qAsConst(mJob.substitutions)) {
            if (earlier.key == key)
                raise(QStringLiteral("Tag %1 stands twice").arg(keyName(key)));
        }
        if (mJob.substitutions.size() >= kMaxSubstitutions)
            raise(QStringLiteral("More than %1 Tags").arg(kMaxSubstitutions));
        mJob.substitutions.append({key, QString()});
    }

    void readValue()
    {
        const qint64 line = mXml.lineNumber();
        const QString text = mXml.readElementText();
        if (mJob.substitutions.isEmpty() || !mJob.substitutions.last().value.isNull()) {
            LogFile::warnf("Line %lld of a job: a Value that belongs to no Tag is passed over",
                           static_cast<long long>(line));
            return;
        }
        // The text of an empty element is null, but an empty Value is a value.
        mJob.substitutions.last().value = text.isNull() ? QStringLiteral("") : text;
    }

    /// Without its value a Tag would wipe what the images have.
    void requireValue()
    {
        if (mJob.substitutions.isEmpty())
            return;
        const QASubstitution& last = mJob.substitutions.last();
        if (last.value.isNull() && last.key != DCM_PixelData)
            raise(QStringLiteral("Tag %1 has no Value").arg(keyName(last.key)));
    }

    QXmlStreamReader mXml;
    QAData mJob;
};

}  // namespace

bool QAData::parse(const QByteArray& xml, QString& message)
{
    return take(xml, message);
}

bool QAData::parseText(const QString& xml, QString& message)
{
    if (xml.isValidUtf16())
        return take(xml, message);
    message = QStringLiteral("The text of the job has half a character");
    return false;
}

template <typename Xml>
bool QAData::take(const Xml& xml, QString& message)
{
    // Before the reader sees a byte of it.
    if (xml.size() > kMaxJobXml) {
        message = QStringLiteral("A job of %1 bytes is longer than %2").arg(xml.size()).arg(kMaxJobXml);
        return false;
    }
    JobReader reader(xml);
    if (!reader.read()) {
        message = reader.fault();
        return false;
    }
    oldStudyUID = reader.job().oldStudyUID;
    substitutions = reader.job().substitutions;
    timestamp = reader.job().timestamp;
    login = reader.job().login;
    return true;
}

}  // namespace Kdd
