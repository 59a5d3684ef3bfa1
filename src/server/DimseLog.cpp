#include "server/DimseLog.h"

#include "server/dicomweb/ResourcePath.h"

#include <QDateTime>
#include <QJsonArray>
#include <QJsonObject>

#include <kddlib/LogFile.h>

#include <cstring>

namespace Kdd
{
namespace
{

qint64 milliseconds(std::chrono::steady_clock::duration duration)
{
    return std::chrono::duration_cast<std::chrono::milliseconds>(duration).count();
}

QJsonObject lineOf(const Dimse::AssociationRecord& record, const char* method)
{
    const Dimse::Caller& caller = record.caller;
    QJsonObject line = {{QStringLiteral("time"), QDateTime::currentDateTimeUtc().toString(Qt::ISODateWithMs)},
                        {QStringLiteral("subject"), QString::fromLatin1(caller.title)},
                        {QStringLiteral("peer"), QString::fromLatin1(caller.address)},
                        {QStringLiteral("called"), QString::fromLatin1(record.called)},
                        {QStringLiteral("method"), QLatin1String(method)},
                        {QStringLiteral("resource"), QStringLiteral("association")},
                        {QStringLiteral("ms"), milliseconds(record.duration)},
                        {QStringLiteral("whole"), record.isReleased},
                        {QStringLiteral("request"), QString::number(record.id)}};
    if (!caller.certificate.isEmpty())
        line.insert(QStringLiteral("certificate"), QString::fromUtf8(caller.certificate));
    return line;
}

QJsonObject lineOf(const Dimse::AssociationRecord& record, const char* method,
                   const Dimse::MethodCount& count)
{
    QJsonObject line = lineOf(record, method);
    line.insert(QStringLiteral("done"), count.done);
    line.insert(QStringLiteral("failed"), count.failed);
    line.insert(QStringLiteral("bytes"), count.bytes);
    QJsonArray studies;
    for (const QByteArray& study : count.studies) {
        if (DicomWeb::isUID(study))
            studies.append(QString::fromLatin1(study));
    }
    if (!studies.isEmpty())
        line.insert(QStringLiteral("studies"), studies);
    if (count.hasMoreStudies)
        line.insert(QStringLiteral("moreStudies"), true);
    return line;
}

}  // namespace

DimseLog::DimseLog(const QByteArray& audit)
    : mAudit(audit.isEmpty() ? nullptr : std::make_unique<Access::AuditFile>(audit))
{
}

Result DimseLog::check() const
{
    return mAudit == nullptr ? Result() : mAudit->check();
}

void DimseLog::performed(const Dimse::Performed& performed)
{
    if (std::strcmp(performed.method, "C-STORE") == 0)
        ++(performed.isDone ? mStored : mNotStored);
}

void DimseLog::ended(const Dimse::AssociationRecord& record)
{
    ++(record.isAccepted ? mAccepted : mRejected);
    for (const auto& [method, count] : record.methods) {
        LogFile::printf("Association %llu of \"%s\" (%s): %s %lld times, %lld not, %lld bytes, %lld ms",
                        record.id, record.caller.title.constData(), record.caller.address.constData(), method,
                        static_cast<long long>(count.done), static_cast<long long>(count.failed),
                        static_cast<long long>(count.bytes),
                        static_cast<long long>(milliseconds(record.duration)));
        if (mAudit != nullptr)
            mAudit->write(lineOf(record, method, count));
    }
    if (mAudit != nullptr && !record.isAccepted)
        mAudit->write(lineOf(record, "A-ASSOCIATE"));
}

}  // namespace Kdd
