#include "server/dicomweb/retrieve/BodyBlocks.h"

#include <iterator>

namespace Kdd::DicomWeb
{

namespace
{

// Each client that does not read holds one [bytes].
constexpr qint64 kBlock = 64 * 1024;

}  // namespace

BodyBlocks::BodyBlocks(std::vector<Http::BodyPart> body)
    : mBody(std::make_move_iterator(body.begin()), std::make_move_iterator(body.end()))
{
}

Result BodyBlocks::next(QByteArray& block)
{
    block.clear();
    Result result;
    while (block.isEmpty() && !mBody.empty() && result.good()) {
        bool isDone = false;
        result = takeFrom(mBody.front(), block, isDone);
        if (isDone)
            mBody.pop_front();
    }
    return result;
}

Result BodyBlocks::takeFrom(Http::BodyPart& part, QByteArray& block, bool& isDone)
{
    if (auto* bytes = std::get_if<QByteArray>(&part)) {
        block = *bytes;
        isDone = true;
        return {};
    }
    if (auto* range = std::get_if<Http::FileRange>(&part)) {
        const qint64 count = qMin(kBlock, range->length);
        const Result read = range->file->read(range->offset, count, block);
        range->offset += count;
        range->length -= count;
        isDone = range->length == 0;
        return read;
    }
    const Result produced = std::get<std::unique_ptr<Http::Producer>>(part)->next(block);
    isDone = block.isEmpty();
    return produced;
}

Result DeflatedBody::next(QByteArray& block)
{
    block.clear();
    // An empty block would be the end, so blocks that give nothing yet are followed by the next.
    while (block.isEmpty() && !mIsFinished) {
        QByteArray plain;
        const Result read = mBlocks.next(plain);
        if (read.bad())
            return read;
        mIsFinished = plain.isEmpty();
        if (mIsFinished)
            mEncoder.finish(block);
        else
            mEncoder.add(plain, block);
        mIsOdd ^= block.size() % 2 != 0;
        if (mIsFinished && mIsOdd)
            block.append('\0');
    }
    return {};
}

}  // namespace Kdd::DicomWeb
