#include "server/access/AuditTrail.h"

#include "server/access/HostName.h"
#include "server/dicomweb/ResourcePath.h"

#include <QDateTime>
#include <QJsonArray>

namespace Kdd::Access
{
namespace
{

/// The nearest of those that a proxy speaks for; null when it does not say.
QByteArray clientOf(const Http::Request& request)
{
    const QByteArray list = request.header("x-forwarded-for");
    return numericAddress(list.mid(list.lastIndexOf(',') + 1).trimmed());
}

}  // namespace

AuditTrail::AuditTrail(QByteArray place, RightsTable table, QVector<QByteArray> proxies)
    : mFile(std::move(place))
    , mTable(std::move(table))
    , mProxies(std::move(proxies))
{
}

QJsonObject AuditTrail::lineOf(const Http::Exchange& exchange) const
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
    return line;
}

void AuditTrail::ended(const Http::Exchange& exchange)
{
    mFile.write(lineOf(exchange));
}

}  // namespace Kdd::Access
