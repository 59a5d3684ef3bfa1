#pragma once

#include "server/access/AuditFile.h"
#include "server/dimse/AssociationObserver.h"

#include <QHash>

#include <atomic>
#include <memory>
#include <mutex>

namespace Kdd
{

/// Counts what associations do, and writes a line into the log and one for each kind of message into the audit trail when one
/// has ended. No names of patients, no values of searches. May be used on any thread.
class DimseLog : public Dimse::AssociationObserver
{
public:
    /// `audit` is where the trail is written, "log" the log; empty: nowhere.
    explicit DimseLog(const QByteArray& audit);

    /// Whether the trail can be written to.
    Result check() const;

    void performed(const Dimse::Performed& performed) override;
    void ended(const Dimse::AssociationRecord& record) override;

    // Since the beginning.

    qint64 stored() const { return mStored; }
    qint64 notStored() const { return mNotStored; }
    qint64 accepted() const { return mAccepted; }
    qint64 rejected() const { return mRejected; }

private:
    std::unique_ptr<Access::AuditFile> mAudit;
    std::atomic<qint64> mStored{0};
    std::atomic<qint64> mNotStored{0};
    std::atomic<qint64> mAccepted{0};
    std::atomic<qint64> mRejected{0};
};

}  // namespace Kdd
