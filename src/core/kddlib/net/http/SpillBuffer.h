#pragma once

#include <cstddef>
#include <deque>
#include <memory>
#include <vector>

namespace Kdd
{

/// Memory for bytes that wait for their reader, in blocks that go round: what one request has given up the next one
/// takes, so that a long download touches no new memory after its beginning.
///
/// Used by one thread.
class SpillBlocks
{
public:
    static constexpr std::size_t kBlockSize = 256 * 1024;  // [bytes]

    using Block = std::unique_ptr<char[]>;

    /// std::bad_alloc when memory is short.
    Block take();
    void giveBack(Block block) { mIdle.push_back(std::move(block)); }

private:
    std::vector<Block> mIdle;
};

/// What has arrived of a response before its reader asked for it. First in, first out.
///
/// It holds as many blocks as its bytes need. The blocks must outlive it.
class SpillBuffer
{
public:
    /// Takes up to `capacity` bytes.
    SpillBuffer(SpillBlocks& blocks, std::size_t capacity)
        : mBlocks(blocks)
        , mCapacity(capacity)
    {
    }
    ~SpillBuffer() { clear(); }
    SpillBuffer(const SpillBuffer&) = delete;
    SpillBuffer& operator=(const SpillBuffer&) = delete;

    std::size_t size() const { return mEnd - mBegin; }
    bool isEmpty() const { return mBegin == mEnd; }
    std::size_t room() const { return mCapacity - size(); }

    /// `count` must not exceed the room. std::bad_alloc leaves what was appended before.
    void append(const char* bytes, std::size_t count);

    /// Moves up to `count` bytes out; returns how many.
    std::size_t take(char* to, std::size_t count);

    void clear();

private:
    SpillBlocks& mBlocks;
    const std::size_t mCapacity;
    std::deque<SpillBlocks::Block> mHeld;
    std::size_t mBegin = 0;  // of the bytes, counted from the start of the first block
    std::size_t mEnd = 0;
};

}  // namespace Kdd
