#pragma once

#include "server/access/AuditFile.h"
#include "server/access/RightsTable.h"
#include "server/http/Exchange.h"

namespace Kdd::Access
{

/// Writes a line of JSON for each request: who, from where, what of which study, and what became of it. No names of
/// patients, no values of searches, no tokens.
class AuditTrail : public Http::ExchangeObserver
{
public:
    /// Into what AuditFile takes for a place. `proxies` are believed when they say for whom they ask.
    AuditTrail(QByteArray place, RightsTable table, QVector<QByteArray> proxies);

    /// Whether it can be written to.
    Result check() const { return mFile.check(); }

    void ended(const Http::Exchange& exchange) override;

private:
    QJsonObject lineOf(const Http::Exchange& exchange) const;

    AuditFile mFile;
    RightsTable mTable;
    QVector<QByteArray> mProxies;
};

}  // namespace Kdd::Access
