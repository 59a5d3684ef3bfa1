#pragma once

#include <QString>

class DcmDataset;

namespace Kdd::Dimse
{

/// How an operation ended: its status, and where that is a failure one line for whoever asked.
struct QueryEnding
{
    quint16 status = 0;
    QString reason;

    bool good() const { return status == 0; }
    bool bad() const { return status != 0; }
};

// Statuses that search and retrieval have in common, and ours among those that say why something cannot be processed.
constexpr quint16 kPending = 0xFF00;
constexpr quint16 kPendingWithoutKeys = 0xFF01;
constexpr quint16 kCancelled = 0xFE00;
constexpr quint16 kTooMany = 0xA700;
constexpr quint16 kMisunderstood = 0xA900;
constexpr quint16 kNoDatabase = 0xC001;
constexpr quint16 kBusy = 0xC002;
constexpr quint16 kUnreadable = 0xC003;

/// Puts the reason where an answer has it, as much of it as has room there.
void describe(const QueryEnding& ending, DcmDataset& detail);

}  // namespace Kdd::Dimse
