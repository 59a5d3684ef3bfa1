#pragma once

#include "kddlib/Limits.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcerror.h>
#include <dcmtk/dcmdata/dcistrma.h>

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <vector>

namespace Kdd
{

makeOFConditionConst(EC_NestedTooDeep, OFM_dcmdata, 0x300, OF_error, "Sequence items are nested too deep");

/// Counts how many sequences the parser is inside of.
///
/// The parser recurses once for each sequence and reads the tags of its items from that depth of the call stack, in
/// two halves. So the stack addresses at which item tags were read are the sequences still open: one that lies deeper
/// than the present address has been left. This holds for every transfer syntax, for deflated data, for lengths that
/// lie and for whatever the parser takes for a sequence, none of which a scan ahead of it could promise.
class NestingGauge
{
public:
    /// Takes what the parser has read from the stack address `frame`; false when it nests too deep.
    bool accept(const void* bytes, offile_off_t count, const void* frame)
    {
        if (count != 2) {
            mHalf[0] = mHalf[1] = 0;
            return true;
        }
        unsigned char second[2];
        std::memcpy(second, bytes, 2);
        const bool isItem = isItemTag(second);
        std::memcpy(mHalf, second, 2);
        return !isItem || enter(reinterpret_cast<std::uintptr_t>(frame));
    }

private:
    /// (fffe,e000) in either byte order.
    bool isItemTag(const unsigned char* second) const
    {
        return (mHalf[0] == 0xfe && mHalf[1] == 0xff && second[0] == 0x00 && second[1] == 0xe0) ||
               (mHalf[0] == 0xff && mHalf[1] == 0xfe && second[0] == 0xe0 && second[1] == 0x00);
    }

    bool enter(std::uintptr_t frame)
    {
        while (!mOpen.empty() && mOpen.back() < frame)
            mOpen.pop_back();
        if (mOpen.empty() || mOpen.back() != frame)
            mOpen.push_back(frame);
        return mOpen.size() <= static_cast<std::size_t>(kMaxItemDepth);
    }

    unsigned char mHalf[2] = {0, 0};
    std::vector<std::uintptr_t> mOpen;
};

/// A stream that turns bad as soon as the parser nests deeper than `kMaxItemDepth` items, which makes it unwind. DCMTK
/// recurses once for each level and would end the process.
template <typename Stream>
class DepthLimited : public Stream
{
public:
    using Stream::Stream;

    offile_off_t read(void* buffer, offile_off_t length) override
    {
        if (mTooDeep)
            return 0;
        const offile_off_t count = Stream::read(buffer, length);
        mTooDeep = !mGauge.accept(buffer, count, __builtin_frame_address(0));
        return count;
    }

    OFBool good() const override { return !mTooDeep && Stream::good(); }

    OFCondition status() const override
    {
        return mTooDeep ? OFCondition(EC_NestedTooDeep) : Stream::status();
    }

    bool isTooDeep() const { return mTooDeep; }

private:
    NestingGauge mGauge;
    bool mTooDeep = false;
};

}  // namespace Kdd
