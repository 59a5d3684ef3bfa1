#include "server/dicomweb/retrieve/EntriesProducer.h"

#include <iterator>

namespace Kdd::DicomWeb
{

namespace
{

// Each client that does not read holds one [bytes].
constexpr qint64 kBlock = 64 * 1024;

}  // namespace

Result EntriesProducer::next(QByteArray& block)
{
    block.clear();
    Result result;
    while (block.isEmpty() && !mIsFinished && result.good())
        result = step(block);
    return result;
}

Result EntriesProducer::step(QByteArray& block)
{
    if (!mBody.empty()) {
        bool isDone = false;
        const Result taken = takeFrom(mBody.front(), block, isDone);
        if (isDone)
            mBody.pop_front();
        mPacking->pass(block);
        return taken;
    }
    if (mHasBegun) {
        mHasBegun = false;
        block = mPacking->end();
    } else if (!mEntries.empty()) {
        Entry& entry = mEntries.front();
        block = mPacking->begin(entry.name, entry.mediaType);
        mBody.assign(std::make_move_iterator(entry.body.begin()), std::make_move_iterator(entry.body.end()));
        mEntries.pop_front();
        mHasBegun = true;
    } else if (mNextImage < mImages) {
        std::vector<Entry> entries;
        const Verdict made = mMake(mNextImage++, entries);
        if (made.bad())
            return Result::failure(made.reason);
        mEntries.assign(std::make_move_iterator(entries.begin()), std::make_move_iterator(entries.end()));
    } else {
        block = mPacking->finish();
        mIsFinished = true;
    }
    return {};
}

Result EntriesProducer::takeFrom(Http::BodyPart& part, QByteArray& block, bool& isDone)
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

}  // namespace Kdd::DicomWeb
