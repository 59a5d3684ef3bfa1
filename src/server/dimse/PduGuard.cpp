#include "server/dimse/PduGuard.h"

#include <QtEndian>

#include <algorithm>

namespace Kdd::Dimse
{
namespace
{

constexpr int kHead = 6;  // of a PDU, and of a value with its context and control byte

// Kinds of PDUs.
constexpr unsigned char kData = 4;
constexpr unsigned char kReleaseRequest = 5;
constexpr unsigned char kReleaseAnswer = 6;
constexpr unsigned char kAbort = 7;

// Control byte of a value.
constexpr unsigned char kIsCommand = 1;
constexpr unsigned char kIsLast = 2;

quint32 lengthAt(const unsigned char* bytes)
{
    return qFromBigEndian<quint32>(bytes);
}

}  // namespace

bool PduGuard::take(const char* bytes, qint64 size)
{
    while (size > 0) {
        qint64 count = 1;
        if (mAt == At::PduHead || mAt == At::ValueHead) {
            mHead[mHeadSize++] = static_cast<unsigned char>(*bytes);
            if (mAt == At::ValueHead)
                --mPduLeft;
            if (mHeadSize == kHead && !(mAt == At::PduHead ? beginPdu() : beginValue()))
                return false;
        } else {
            qint64& left = mAt == At::Value ? mValueLeft : mPduLeft;
            count = std::min(size, left);
            left -= count;
            if (mAt == At::Value)
                mPduLeft -= count;
            if (mAt == At::Value && mValueLeft == 0 && !endValue())
                return false;
            if (mAt == At::Rest && mPduLeft == 0)
                mAt = At::PduHead;
        }
        bytes += count;
        size -= count;
    }
    return true;
}

bool PduGuard::beginPdu()
{
    mHeadSize = 0;
    const unsigned char kind = mHead[0];
    mPduLeft = lengthAt(mHead + 2);
    if (kind == kData) {
        mAt = At::ValueHead;
        return mPduLeft >= kHead && mPduLeft <= mLimits.pdu;
    }
    mAt = At::Rest;
    return (kind == kReleaseRequest || kind == kReleaseAnswer || kind == kAbort) && mPduLeft == 4;
}

bool PduGuard::beginValue()
{
    mHeadSize = 0;
    const qint64 length = lengthAt(mHead);  // with the two bytes behind it
    mControl = mHead[5];
    mValueLeft = length - 2;
    if (length < 2 || mValueLeft > mPduLeft)
        return false;
    const bool isCommand = (mControl & kIsCommand) != 0;
    qint64& sum = isCommand ? mCommandBytes : mDatasetBytes;
    sum += mValueLeft;
    if (sum > (isCommand ? mLimits.command : mMostDataset))
        return false;
    mAt = At::Value;
    return mValueLeft > 0 || endValue();
}

bool PduGuard::endValue()
{
    if ((mControl & kIsLast) != 0 && (mControl & kIsCommand) != 0)
        mCommandBytes = 0;
    else if ((mControl & kIsLast) != 0)
        mDatasetBytes = 0;
    mAt = mPduLeft == 0 ? At::PduHead : At::ValueHead;
    return mPduLeft == 0 || mPduLeft >= kHead;
}

namespace
{

// Items of a request.
constexpr unsigned char kApplicationContext = 0x10;
constexpr unsigned char kPresentationContext = 0x20;
constexpr unsigned char kAbstractSyntax = 0x30;
constexpr unsigned char kTransferSyntax = 0x40;
constexpr unsigned char kUserInformation = 0x50;

constexpr int kBeforeItems = 68;           // version, titles, and what is kept free
constexpr quint32 kLongestUid = 64;        // [bytes]
constexpr int kMostContexts = 128;         // they have odd numbers of one byte
constexpr int kMostTransferSyntaxes = 50;  // of one context; there are some forty
constexpr int kMostUserItems = 1000;       // two or three for each of the contexts

/// One item after the other, each with its kind, a byte that is kept free, and its length in two bytes.
template <typename Take>
bool forEachItem(const char* bytes, qint64 size, const Take& take)
{
    while (size > 0) {
        if (size < 4)
            return false;
        const auto length = qint64(qFromBigEndian<quint16>(bytes + 2));
        if (length > size - 4 || !take(static_cast<unsigned char>(*bytes), bytes + 4, length))
            return false;
        bytes += 4 + length;
        size -= 4 + length;
    }
    return true;
}

bool isContext(const char* bytes, qint64 size)
{
    int abstractSyntaxes = 0;
    int transferSyntaxes = 0;
    const bool isWhole =
        size > 4 && forEachItem(bytes + 4, size - 4, [&](unsigned char kind, const char*, qint64 length) {
            abstractSyntaxes += kind == kAbstractSyntax ? 1 : 0;
            transferSyntaxes += kind == kTransferSyntax ? 1 : 0;
            return (kind == kAbstractSyntax || kind == kTransferSyntax) && length > 0 &&
                   length <= kLongestUid;
        });
    return isWhole && abstractSyntaxes == 1 && transferSyntaxes > 0 &&
           transferSyntaxes <= kMostTransferSyntaxes && (bytes[0] & 1) != 0;
}

/// Each with a text, or with lengths inside that are held against the item's.
bool isUserItem(unsigned char kind, const char* bytes, qint64 length)
{
    switch (kind) {
    case 0x51:  // how large PDUs may be
    case 0x53:  // how many messages at a time
        return length == 4;
    case 0x52:  // UID of the implementation
    case 0x55:  // name of its version, which some make longer than they may
        return length > 0 && length <= kLongestUid;
    case 0x54:  // roles: length and UID of a class, and two bytes
    case 0x56:  // more about a class, likewise
        return length >= 4 && qFromBigEndian<quint16>(bytes) <= kLongestUid &&
               qFromBigEndian<quint16>(bytes) <= length - 2 - (kind == 0x54 ? 2 : 0);
    case 0x58: {  // who the user is: two bytes, and two values with their lengths
        if (length < 6 || qFromBigEndian<quint16>(bytes + 2) > length - 6)
            return false;
        const qint64 first = qFromBigEndian<quint16>(bytes + 2);
        return qFromBigEndian<quint16>(bytes + 4 + first) == length - 6 - first;
    }
    default:
        return true;
    }
}

}  // namespace

bool isWellFormedRequest(const char* bytes, qint64 size)
{
    int contexts = 0;
    int userItems = 0;
    int applicationContexts = 0;
    int userInformations = 0;
    const auto takeUserItem = [&](unsigned char kind, const char* at, qint64 length) {
        return ++userItems <= kMostUserItems && isUserItem(kind, at, length);
    };
    const auto takeItem = [&](unsigned char kind, const char* at, qint64 length) {
        switch (kind) {
        case kApplicationContext:
            return ++applicationContexts == 1 && length > 0 && length <= kLongestUid;
        case kPresentationContext:
            return ++contexts <= kMostContexts && isContext(at, length);
        case kUserInformation:
            return ++userInformations == 1 && forEachItem(at, length, takeUserItem);
        default:
            return false;
        }
    };
    return size > kBeforeItems && forEachItem(bytes + kBeforeItems, size - kBeforeItems, takeItem) &&
           applicationContexts == 1 && contexts > 0 && userInformations == 1;
}

}  // namespace Kdd::Dimse
