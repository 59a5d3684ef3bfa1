#include "server/dicomweb/change/JobText.h"

#include "server/dicomweb/ResourcePath.h"
#include "server/http/StrictJson.h"

#include <QJsonArray>
#include <QRegularExpression>

#include <kddlib/Limits.h>
#include <kddlib/QAData.h>

#include <algorithm>

namespace Kdd::DicomWeb
{
namespace
{

/// Whether XML can say it: no control characters, no half of a character.
bool isXmlText(const QString& text)
{
    return text.isValidUtf16() && std::all_of(text.begin(), text.end(), [](QChar c) {
               return c.unicode() >= 0x20
                          ? c.unicode() < 0xfffe
                          : c == QLatin1Char('\t') || c == QLatin1Char('\n') || c == QLatin1Char('\r');
           });
}

/// As it stands inside of an element or between quotes, so that what reads it gets every blank and line end again.
QString escaped(const QString& text)
{
    QString made;
    for (const QChar c : text) {
        const ushort code = c.unicode();
        if (code < 0x20 || code == 0x85 || code == 0x2028 || c == QLatin1Char('<') || c == QLatin1Char('>') ||
            c == QLatin1Char('&') || c == QLatin1Char('"') || c == QLatin1Char('\''))
            made += QStringLiteral("&#%1;").arg(code);
        else
            made += c;
    }
    return made;
}

/// Makes the XML of a job of its JSON, so that one reader judges both.
class JobConversion
{
public:
    explicit JobConversion(const QJsonObject& object)
        : mObject(object)
    {
    }

    /// Empty when the object is no job.
    QString xml()
    {
        QString made = QStringLiteral("<Job>");
        if (const QJsonValue time = mObject.take(QStringLiteral("timestamp")); !time.isUndefined())
            made += element("Timestamp", text(time, "timestamp"));
        if (const QJsonValue login = mObject.take(QStringLiteral("login")); !login.isUndefined())
            made += element("Login", text(login, "login"));
        made += QStringLiteral("<Substitutions");
        if (const QJsonValue old = mObject.take(QStringLiteral("oldStudy")); !old.isUndefined())
            made += QStringLiteral(" OldSUID=\"%1\"").arg(escaped(uid(old, "oldStudy")));
        made += QLatin1Char('>');
        const QJsonArray tags = list("tags");
        for (const QJsonValue tag : tags)
            made += tagOf(tag);
        mImages = uids("images");
        mSeries = uids("series");
        const QJsonValue whole = mObject.take(QStringLiteral("wholeStudy"));
        mIsOfWholeStudy = whole.toBool();
        if (!whole.isUndefined() && !whole.isBool())
            fail(QStringLiteral("wholeStudy is neither true nor false"));
        if (!mObject.isEmpty())
            fail(QStringLiteral("\"%1\" is nothing that stands in a job").arg(mObject.begin().key()));
        return mFault.isEmpty() ? made + QStringLiteral("</Substitutions></Job>") : QString();
    }

    void addImagesTo(QAData& job) const
    {
        job.images += mImages;
        job.series += mSeries;
        job.isOfWholeStudy = job.isOfWholeStudy || mIsOfWholeStudy;
    }

    const QString& fault() const { return mFault; }

private:
    void fail(const QString& fault)
    {
        if (mFault.isEmpty())
            mFault = fault;
    }

    static QString element(const char* name, const QString& content)
    {
        return QStringLiteral("<%1>%2</%1>").arg(QLatin1String(name), escaped(content));
    }

    QString text(const QJsonValue& value, const char* name)
    {
        const QString found = value.toString();
        if (!value.isString() || !isXmlText(found))
            fail(QStringLiteral("%1 is no text, or has characters that no value may have")
                     .arg(QLatin1String(name)));
        return found;
    }

    QString uid(const QJsonValue& value, const char* name)
    {
        const QString found = text(value, name);
        if (!isUID(found.toUtf8()))
            fail(QStringLiteral("%1 has something that is no UID").arg(QLatin1String(name)));
        return found;
    }

    QJsonArray list(const char* name)
    {
        const QJsonValue value = mObject.take(QLatin1String(name));
        if (!value.isUndefined() && !value.isArray())
            fail(QStringLiteral("%1 is no list").arg(QLatin1String(name)));
        return value.toArray();
    }

    QList<QByteArray> uids(const char* name)
    {
        QList<QByteArray> made;
        const QJsonArray values = list(name);
        for (const QJsonValue value : values)
            made.append(uid(value, name).toUtf8());
        return made;
    }

    QString tagOf(const QJsonValue& value)
    {
        static const QRegularExpression kDigits(QStringLiteral("\\A[0-9A-Fa-f]{8}\\z"));
        QJsonObject object = value.toObject();
        const QString key = text(object.take(QStringLiteral("tag")), "tag");
        if (!kDigits.match(key).hasMatch())
            fail(QStringLiteral("\"%1\" is no tag of eight hexadecimal digits").arg(key));
        QString made = QStringLiteral("<Tag Group=\"%1\" Element=\"%2\">").arg(key.left(4), key.mid(4));
        if (const QJsonValue content = object.take(QStringLiteral("value")); !content.isUndefined())
            made += element("Value", text(content, "value"));
        if (!object.isEmpty())
            fail(QStringLiteral("\"%1\" is nothing that stands in a tag").arg(object.begin().key()));
        return made + QStringLiteral("</Tag>");
    }

    QJsonObject mObject;  // what is taken is known, and what is left nobody knows
    QList<QByteArray> mImages;
    QList<QByteArray> mSeries;
    bool mIsOfWholeStudy = false;
    QString mFault;
};

bool readJson(const QByteArray& text, QAData& job, QString& reason)
{
    static const QRegularExpression kLine(QStringLiteral("\\ALine \\d+: "));
    QJsonObject object;
    if (!Http::parseObject(text, object)) {
        reason = QStringLiteral("The job is no JSON object, or says something twice");
        return false;
    }
    JobConversion conversion(object);
    const QString xml = conversion.xml();
    reason = conversion.fault();
    if (xml.isEmpty())
        return false;
    if (!job.parse(xml.toUtf8(), reason)) {
        // Lines of a text that nobody sent.
        reason.remove(kLine);
        return false;
    }
    conversion.addImagesTo(job);
    return true;
}

}  // namespace

bool readJob(const QByteArray& text, JobForm form, QAData& job, QString& reason)
{
    if (form == JobForm::Xml)
        return job.parse(text, reason);
    if (text.size() <= kMaxJobXml)
        return readJson(text, job, reason);
    reason = QStringLiteral("A job of %1 bytes is longer than %2").arg(text.size()).arg(kMaxJobXml);
    return false;
}

}  // namespace Kdd::DicomWeb
