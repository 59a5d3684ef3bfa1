// A correction in JSON. One that is taken says, letter by letter, what its text says, although it went through XML, and names
// nothing that is no UID. The same bytes are a name of a caller, and a value that is exported.

#include "fuzz/Property.h"
#include "server/dicomweb/ResourcePath.h"
#include "server/dicomweb/change/CorrectionBody.h"
#include "server/dicomweb/change/CorrectionHistory.h"

#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>

#include <algorithm>

using namespace Kdd;
using namespace Kdd::DicomWeb;

namespace
{

void checkJob(const QByteArray& text, const QAData& job)
{
    const QJsonObject said = QJsonDocument::fromJson(text).object();
    const QJsonArray tags = said.value(QLatin1String("tags")).toArray();
    require(tags.size() == job.substitutions.size(), "all tags are there");
    for (int i = 0; i < tags.size(); ++i) {
        const QASubstitution& each = job.substitutions.at(i);
        const QJsonValue value = tags.at(i)[QLatin1String("value")];
        require(value.isString() ? each.value == value.toString() && !each.value.isNull()
                                 : each.value.isNull(),
                "a value is what is said");
        const uint key = tags.at(i)[QLatin1String("tag")].toString().toUInt(nullptr, 16);
        require(key == (uint(each.key.getGroup()) << 16 | each.key.getElement()), "a tag is what is said");
    }
    require(QString::fromLatin1(job.login) == said.value(QLatin1String("login")).toString().trimmed(),
            "a login is what is said");
    require(QString::fromLatin1(job.timestamp) == said.value(QLatin1String("timestamp")).toString(),
            "a time is what is said");
    require(QString::fromLatin1(job.oldStudyUID) == said.value(QLatin1String("oldStudy")).toString(),
            "a study is what is said");
    require(std::all_of(job.images.begin(), job.images.end(), isUID) &&
                std::all_of(job.series.begin(), job.series.end(), isUID),
            "what is named has a UID");
}

/// Whatever a caller is called, a job takes his name.
void checkLogin(const QByteArray& caller)
{
    const QByteArray login = loginOf(caller);
    require(std::all_of(login.begin(), login.end(),
                        [](char c) { return QChar(ushort(static_cast<uchar>(c))).isPrint(); }),
            "a login is one line");
}

/// Read as RFC 4180 has it the field is the value, behind an apostrophe perhaps.
void checkField(const QString& value)
{
    QByteArray field = csvField(value);
    require(field.size() >= 2 && field.startsWith('"') && field.endsWith('"'), "a field is in quotes");
    field = field.mid(1, field.size() - 2);
    require(!QByteArray(field).replace("\"\"", "").contains('"'), "quotes are doubled");
    QString read = QString::fromUtf8(field.replace("\"\"", "\""));
    require(read.isEmpty() || !QStringLiteral("=+-@\t\r\n").contains(read.trimmed().left(1)) ||
                read.startsWith(QLatin1Char('\'')) || read.trimmed().isEmpty(),
            "a field is no formula");
    if (read.startsWith(QLatin1Char('\'')))
        read.remove(0, 1);
    require(read == QString::fromUtf8(value.toUtf8()), "a field is the value");
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, std::size_t size)
{
    const QByteArray text = bytesOf(data, size);
    checkLogin(text);
    checkField(QString::fromUtf8(text));
    QAData job;
    QString reason;
    if (readJob(text, JobForm::Json, job, reason))
        checkJob(text, job);
    else
        require(!reason.isEmpty(), "a fault is told");
    return 0;
}
