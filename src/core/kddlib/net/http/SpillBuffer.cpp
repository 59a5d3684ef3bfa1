#include "kddlib/net/http/SpillBuffer.h"

#include <algorithm>
#include <cstring>

namespace Kdd
{

SpillBlocks::Block SpillBlocks::take()
{
    if (mIdle.empty())
        return Block(new char[kBlockSize]);  // not cleared: every byte is written before it is read
    Block block = std::move(mIdle.back());
    mIdle.pop_back();
    return block;
}

void SpillBuffer::append(const char* bytes, std::size_t count)
{
    while (count > 0) {
        const std::size_t offset = mEnd % SpillBlocks::kBlockSize;
        // The last block is full, or there is none yet.
        if (mEnd == mHeld.size() * SpillBlocks::kBlockSize)
            mHeld.push_back(mBlocks.take());
        const std::size_t part = std::min(count, SpillBlocks::kBlockSize - offset);
        std::memcpy(mHeld.back().get() + offset, bytes, part);
        bytes += part;
        count -= part;
        mEnd += part;
    }
}

std::size_t SpillBuffer::take(char* to, std::size_t count)
{
    const std::size_t wanted = std::min(count, size());
    for (std::size_t left = wanted; left > 0;) {
        const std::size_t part = std::min(left, SpillBlocks::kBlockSize - mBegin);
        std::memcpy(to, mHeld.front().get() + mBegin, part);
        to += part;
        left -= part;
        mBegin += part;
        if (mBegin == SpillBlocks::kBlockSize) {
            // At once, so that the next request takes this memory instead of new.
            mBlocks.giveBack(std::move(mHeld.front()));
            mHeld.pop_front();
            mBegin = 0;
            mEnd -= SpillBlocks::kBlockSize;
        }
    }
    // The next bytes begin a block again, so that the last one is not held for a few of them.
    if (isEmpty())
        clear();
    return wanted;
}

void SpillBuffer::clear()
{
    for (SpillBlocks::Block& block : mHeld)
        mBlocks.giveBack(std::move(block));
    mHeld.clear();
    mBegin = mEnd = 0;
}

}  // namespace Kdd
