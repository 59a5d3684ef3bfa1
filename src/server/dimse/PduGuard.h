#pragma once

#include <QtGlobal>

namespace Kdd::Dimse
{

/// How large what comes over an association may be [bytes].
struct PduLimits
{
    quint32 pdu = 128 * 1024;     ///< of data, as the other side is told
    qint64 command = 16 * 1024;   ///< all attributes of a command, which are read in memory and recursively
    qint64 dataset = 256 * 1024;  ///< until a larger one is expected
};

/// Follows the bytes that come over an association once it is agreed on, from PDU to PDU and from value to value, and
/// notices what nobody should read on. Used by one thread at a time.
class PduGuard
{
public:
    explicit PduGuard(const PduLimits& limits)
        : mLimits(limits)
    {
    }

    /// False when lengths do not fit into each other, a PDU is of a kind that has no place here, or something is too large.
    bool take(const char* bytes, qint64 size);

    /// Of the dataset that comes next, or has begun.
    void expectDataset(qint64 most) { mMostDataset = most; }

private:
    enum class At { PduHead, ValueHead, Value, Rest };

    bool beginPdu();
    bool beginValue();
    bool endValue();

    PduLimits mLimits;
    qint64 mMostDataset = mLimits.dataset;
    At mAt = At::PduHead;
    unsigned char mHead[6] = {};
    int mHeadSize = 0;
    qint64 mPduLeft = 0;
    qint64 mValueLeft = 0;
    unsigned char mControl = 0;
    qint64 mCommandBytes = 0;
    qint64 mDatasetBytes = 0;
};

/// Whether an A-ASSOCIATE-RQ, without the six bytes before it, is made as it should be: items that fit into each other, names
/// that are not too long, and not more of anything than there may be.
bool isWellFormedRequest(const char* bytes, qint64 size);

}  // namespace Kdd::Dimse
