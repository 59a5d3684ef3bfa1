#include "kddlib/archive/CorrectedDataset.h"

namespace Kdd
{

qint64 DecodedPixels::lengthOf(const FrameIndex& index)
{
    // Divided, not multiplied: a number of frames is a claim and the product may wrap.
    constexpr qint64 kMostBits = 8 * qint64(0xffffffff);
    const qint64 bits = index.decodedBits();
    if (bits > 0 && index.frames() > kMostBits / bits)
        return kMostBits / 8;
    const qint64 bytes = (bits * index.frames() + 7) / 8;
    return bytes + bytes % 2;
}

Result DecodedPixels::next(QByteArray& block)
{
    block.clear();
    if (mFrame < mIndex.frames()) {
        QByteArray frame;
        Result result = mIndex.readDecoded(mFile, mFrame, frame);
        if (result.bad())
            return result.within(QStringLiteral("Frame %1").arg(mFrame + 1));
        ++mFrame;
        append(frame, block);
    }
    // The last bits, and what makes the length even.
    if (mFrame == mIndex.frames() && mBits > 0) {
        block.append(static_cast<char>(mPending));
        mBits = 0;
    }
    mGiven += block.size();
    if (mFrame == mIndex.frames() && mGiven % 2 != 0) {
        block.append('\0');
        ++mGiven;
    }
    return {};
}

void DecodedPixels::append(const QByteArray& frame, QByteArray& block)
{
    const auto rest = static_cast<int>(mIndex.decodedBits() % 8);
    if (rest == 0) {
        block = frame;
        return;
    }
    for (int i = 0; i < frame.size(); ++i) {
        const int bits = i + 1 < frame.size() ? 8 : rest;
        mPending |= unsigned(quint8(frame.at(i))) << unsigned(mBits);
        mBits += bits;
        if (mBits >= 8) {
            block.append(static_cast<char>(mPending & 0xffU));
            mPending >>= 8U;
            mBits -= 8;
        }
    }
}

}  // namespace Kdd
