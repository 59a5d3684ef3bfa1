#include "platform/compression/CompressedCosts.h"

#include <algorithm>
#include <iterator>

namespace Kdd
{

namespace
{

constexpr int kFrame = 4 + 2;  // the length of the content, and the head of a zlib stream [bytes]
constexpr int kMaxCodeLength = 15;
constexpr int kMaxLiterals = 288;
constexpr int kMaxDistances = 32;
constexpr int kEndOfBlock = 256;
constexpr int kFirstLength = 257;
constexpr int kCodeLengths = 19;

// Of the codes of lengths: the least length, and how many bits more follow.
constexpr int kLengths[] = {3,  4,  5,  6,  7,  8,  9,  10, 11,  13,  15,  17,  19,  23, 27,
                            31, 35, 43, 51, 59, 67, 83, 99, 115, 131, 163, 195, 227, 258};
constexpr int kLengthBits[] = {0, 0, 0, 0, 0, 0, 0, 0, 1, 1, 1, 1, 2, 2, 2,
                               2, 3, 3, 3, 3, 4, 4, 4, 4, 5, 5, 5, 5, 0};
// How many bits follow the codes of distances.
constexpr int kDistanceBits[] = {0, 0, 0, 0, 1, 1, 2, 2,  3,  3,  4,  4,  5,  5,  6,
                                 6, 7, 7, 8, 8, 9, 9, 10, 10, 11, 11, 12, 12, 13, 13};
// In which order the lengths of the codes are given that the lengths of the other codes are written in.
constexpr int kOrder[] = {16, 17, 18, 0, 8, 7, 9, 6, 10, 5, 11, 4, 12, 3, 13, 2, 14, 1, 15};

/// Bits from the lowest of each byte on. Past the end they are 0 and the reader has failed.
class Bits
{
public:
    explicit Bits(const QByteArray& in)
        : mIn(in)
        , mAt(qint64{kFrame} * 8)
    {
    }

    int take()
    {
        const qint64 byte = mAt / 8;
        mFailed = mFailed || byte >= mIn.size();
        if (mFailed)
            return 0;
        return (static_cast<unsigned char>(mIn.at(static_cast<int>(byte))) >> (mAt++ % 8)) & 1;
    }

    int take(int count)
    {
        int value = 0;
        for (int i = 0; i < count; ++i)
            value |= take() << i;
        return value;
    }

    void toNextByte() { mAt = (mAt + 7) / 8 * 8; }
    void skip(qint64 count)
    {
        mFailed = mFailed || count > qint64(mIn.size()) * 8 - mAt;
        mAt += mFailed ? 0 : count;
    }

    qint64 at() const { return mAt; }
    bool failed() const { return mFailed; }

private:
    const QByteArray& mIn;
    qint64 mAt;
    bool mFailed = false;
};

/// A Huffman code, known by how long the code of each symbol is.
class Code
{
public:
    /// False when there are more codes than bits can tell apart.
    bool assign(const int* lengths, int symbols)
    {
        std::fill(std::begin(mCounts), std::end(mCounts), 0);
        for (int i = 0; i < symbols; ++i)
            ++mCounts[lengths[i]];
        mCounts[0] = 0;
        int first[kMaxCodeLength + 2] = {};
        int left = 1;
        for (int length = 1; length <= kMaxCodeLength; ++length) {
            left = 2 * left - mCounts[length];
            first[length + 1] = first[length] + mCounts[length];
            if (left < 0)
                return false;
        }
        for (int i = 0; i < symbols; ++i) {
            if (lengths[i] != 0)
                mSymbols[first[lengths[i]]++] = i;
        }
        return true;
    }

    /// The next symbol; -1 when the bits are none's.
    int read(Bits& in) const
    {
        // Codes of one length follow each other, and begin behind twice the last of those that are one bit shorter.
        int code = 0;
        int first = 0;
        int index = 0;
        for (int length = 1; length <= kMaxCodeLength; ++length) {
            code |= in.take();
            const int count = mCounts[length];
            if (code - first < count)
                return mSymbols[index + code - first];
            index += count;
            first = (first + count) * 2;
            code *= 2;
        }
        return -1;
    }

private:
    int mCounts[kMaxCodeLength + 1] = {};
    int mSymbols[kMaxLiterals] = {};
};

class Walk
{
public:
    Walk(const QByteArray& in, const CostReceiver& tell)
        : mBits(in)
        , mTell(tell)
    {
    }

    bool run()
    {
        bool isLast = false;
        while (!isLast) {
            isLast = mBits.take() != 0;
            if (!block(mBits.take(2)) || mBits.failed())
                return false;
        }
        return true;
    }

private:
    bool block(int kind)
    {
        switch (kind) {
        case 0:
            return storedBlock();
        case 1:
            return setFixedCodes() && compressedBlock();
        case 2:
            return readCodes() && compressedBlock();
        default:
            return false;
        }
    }

    bool storedBlock()
    {
        mBits.toNextByte();
        const int length = mBits.take(16);
        mBits.skip(16);  // its complement
        told(0);
        mBits.skip(qint64(length) * 8);
        if (!mBits.failed())
            told(length);
        return !mBits.failed();
    }

    bool setFixedCodes()
    {
        int lengths[kMaxLiterals] = {};
        for (int i = 0; i < kMaxLiterals; ++i)
            lengths[i] = i < 144 ? 8 : i < 256 ? 9 : i < 280 ? 7 : 8;
        int distances[kMaxDistances] = {};
        std::fill(std::begin(distances), std::end(distances), 5);
        return mLiterals.assign(lengths, kMaxLiterals) && mDistances.assign(distances, kMaxDistances);
    }

    bool readCodes()
    {
        const int literals = mBits.take(5) + kFirstLength;
        const int distances = mBits.take(5) + 1;
        const int known = mBits.take(4) + 4;
        int ofLengths[kCodeLengths] = {};
        for (int i = 0; i < known; ++i)
            ofLengths[kOrder[i]] = mBits.take(3);
        Code code;
        int lengths[kMaxLiterals + kMaxDistances] = {};
        return literals <= kMaxLiterals && code.assign(ofLengths, kCodeLengths) &&
               readLengths(code, literals + distances, lengths) && mLiterals.assign(lengths, literals) &&
               mDistances.assign(lengths + literals, distances);
    }

    /// Lengths below 16 as they are; the others say how often the one before, or none, comes again.
    bool readLengths(const Code& code, int count, int* lengths)
    {
        for (int at = 0; at < count && !mBits.failed();) {
            const int symbol = code.read(mBits);
            if (symbol < 0 || (symbol == 16 && at == 0))
                return false;
            if (symbol < 16) {
                lengths[at++] = symbol;
                continue;
            }
            const int value = symbol == 16 ? lengths[at - 1] : 0;
            const int times = symbol == 16   ? 3 + mBits.take(2)
                              : symbol == 17 ? 3 + mBits.take(3)
                                             : 11 + mBits.take(7);
            if (times > count - at)
                return false;
            for (int i = 0; i < times; ++i)
                lengths[at++] = value;
        }
        return !mBits.failed();
    }

    bool compressedBlock()
    {
        told(0);
        while (!mBits.failed()) {
            const int symbol = mLiterals.read(mBits);
            if (symbol < 0 || mBits.failed())
                return false;
            if (symbol == kEndOfBlock) {
                told(0);
                return true;
            }
            if (symbol >= kFirstLength && !repetition(symbol - kFirstLength))
                return false;
            if (symbol < kEndOfBlock)
                told(1);
        }
        return false;
    }

    bool repetition(int code)
    {
        if (code >= int(std::size(kLengths)))
            return false;
        const int length = kLengths[code] + mBits.take(kLengthBits[code]);
        const int distance = mDistances.read(mBits);
        if (distance < 0 || distance >= int(std::size(kDistanceBits)))
            return false;
        mBits.skip(kDistanceBits[distance]);
        if (!mBits.failed())
            told(length);
        return !mBits.failed();
    }

    /// All bits since the last time.
    void told(qint64 bytes)
    {
        mTell(bytes, mBits.at() - mTold);
        mTold = mBits.at();
    }

    Bits mBits;
    const CostReceiver& mTell;
    qint64 mTold = qint64{kFrame} * 8;
    Code mLiterals;
    Code mDistances;
};

}  // namespace

bool qxCosts(const QByteArray& in, const CostReceiver& tell)
{
    return Walk(in, tell).run();
}

}  // namespace Kdd
