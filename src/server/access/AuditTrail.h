#pragma once

#include "server/access/RightsTable.h"
#include "server/http/Exchange.h"

#include <kddlib/Result.h>

#include <atomic>

namespace Kdd::Access
{

/// Writes a line of JSON for each request: who, from where, what of which study, and what became of it. No names of
/// patients, no values of searches, no tokens.
class AuditTrail : public Http::ExchangeObserver
{
public:
    /// Into a file, which is opened for each line: one that was moved away is followed by a new one. "log": into the log.
    /// `proxies` are believed when they say for whom they ask.
    AuditTrail(QByteArray place, RightsTable table, QVector<QByteArray> proxies);

    /// Whether it can be written to.
    Result check() const;

    void ended(const Http::Exchange& exchange) override;

private:
    QByteArray lineOf(const Http::Exchange& exchange) const;
    Result append(const QByteArray& line) const;

    QByteArray mPlace;
    RightsTable mTable;
    QVector<QByteArray> mProxies;
    std::atomic<bool> mIsBroken{false};
};

}  // namespace Kdd::Access
