#include "server/access/AuditTrail.h"

#include "server/access/HostName.h"
#include "server/dicomweb/ResourcePath.h"

#include <QDateTime>
#include <QFile>
#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>

#include <fcntl.h>
#include <kddlib/LogFile.h>
#include <kddlib/SystemResult.h>
#include <unistd.h>

#include <cerrno>

namespace Kdd::Access
{
namespace
{

/// For the group that keeps trails, and nobody else: they tell who looked at whom.
constexpr int kMode = 0640;

/// The nearest of those that a proxy speaks for; null when it does not say.
QByteArray clientOf(const Http::Request& request)
{
    const QByteArray list = request.header("x-forwarded-for");
    return numericAddress(list.mid(list.lastIndexOf(',') + 1).trimmed());
}

}  // namespace

AuditTrail::AuditTrail(QByteArray place, RightsTable table, QVector<QByteArray> proxies)
    : mPlace(std::move(place))
    , mTable(std::move(table))
    , mProxies(std::move(proxies))
{
}

Result AuditTrail::append(const QByteArray& line) const
{
    const int file = ::open(mPlace.constData(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, kMode);
    if (file < 0)
        return Result(SystemResult::of(errno)).within(QFile::decodeName(mPlace));
    // In one piece, so that the lines of several servers stand behind each other.
    const ssize_t written = ::write(file, line.constData(), static_cast<std::size_t>(line.size()));
    const Result result =
        written == line.size() ? Result() : Result(SystemResult::of(written < 0 ? errno : ENOSPC));
    ::close(file);
    return result.within(QFile::decodeName(mPlace));
}

Result AuditTrail::check() const
{
    return mPlace == "log" ? Result() : append({});
}

QByteArray AuditTrail::lineOf(const Http::Exchange& exchange) const
{
    const Http::Request& request = exchange.request;
    const Asked asked = mTable.find(request);
    const auto ms = std::chrono::duration_cast<std::chrono::milliseconds>(exchange.duration).count();
    QJsonObject line = {{QStringLiteral("time"), QDateTime::currentDateTimeUtc().toString(Qt::ISODateWithMs)},
                        {QStringLiteral("subject"), QString::fromUtf8(exchange.caller)},
                        {QStringLiteral("peer"), QString::fromLatin1(request.peer)},
                        {QStringLiteral("method"), QLatin1String(nameOf(request.method))},
                        {QStringLiteral("resource"), QLatin1String(asked.kind)},
                        {QStringLiteral("status"), exchange.status},
                        {QStringLiteral("bytes"), exchange.bytes},
                        {QStringLiteral("ms"), static_cast<qint64>(ms)},
                        {QStringLiteral("whole"), exchange.isWhole},
                        {QStringLiteral("request"), QString::fromLatin1(request.id)}};
    QVector<QByteArray> studies;
    if (exchange.effect) {
        studies = exchange.effect->studies;
        line.insert(QStringLiteral("images"), exchange.effect->images);
    }
    if (!studies.contains(asked.study))
        studies.prepend(asked.study);
    QJsonArray named;
    for (const QByteArray& study : qAsConst(studies)) {
        // Else it is a text that a client made up, and might be a name.
        if (DicomWeb::isUID(study))
            named.append(QString::fromLatin1(study));
    }
    if (!named.isEmpty())
        line.insert(QStringLiteral("studies"), named);
    if (mProxies.contains(request.peer))
        if (const QByteArray client = clientOf(request); !client.isEmpty())
            line.insert(QStringLiteral("client"), QString::fromLatin1(client));
    return QJsonDocument(line).toJson(QJsonDocument::Compact) + '\n';
}

void AuditTrail::ended(const Http::Exchange& exchange)
{
    const QByteArray line = lineOf(exchange);
    if (mPlace == "log") {
        LogFile::printf("Audit %s", line.left(line.size() - 1).constData());
        return;
    }
    const Result result = append(line);
    // Told once and not with every request, of which there are thousands.
    if (result.bad() != mIsBroken.exchange(result.bad())) {
        if (result.bad())
            LogFile::errorf("The audit trail cannot be written: %s", qUtf8Printable(result.text()));
        else
            LogFile::warnf("The audit trail is written again; what was asked meanwhile is not in it");
    }
}

}  // namespace Kdd::Access
