#pragma once

#include "server/access/RightsTable.h"
#include "server/access/SyslogSender.h"
#include "server/http/Exchange.h"

#include <QHash>

namespace Kdd::Access
{

/// Tells a syslog receiver of what is done with studies, who signs in, and when the server starts and stops, in the audit
/// messages of DICOM. No names of patients, no values of searches, no tokens.
///
/// A viewer asks for a study in hundreds of requests: what somebody does with one is told once in a minute.
class AuditMessages : public Http::ExchangeObserver
{
public:
    AuditMessages(const SyslogRules& rules, RightsTable table);

    /// Tells that the server stops.
    ~AuditMessages() override;

    void ended(const Http::Exchange& exchange) override;

    /// The messages for an exchange, each of one study, without what stands in front of them; none where nothing of the archive is
    /// concerned.
    static QVector<QByteArray> messagesOf(const Http::Exchange& exchange, const Asked& asked,
                                          const QByteArray& time, const QByteArray& host);

private:
    void send(const QByteArray& message, const QByteArray& time);
    bool isNew(const QByteArray& digest);

    RightsTable mTable;
    QByteArray mHost;
    std::mutex mMutex;
    QHash<QByteArray, std::chrono::steady_clock::time_point> mTold;
    SyslogSender mSender;
};

}  // namespace Kdd::Access
