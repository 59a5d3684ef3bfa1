#include "server/dicomweb/retrieve/EntriesProducer.h"

#include <iterator>

namespace Kdd::DicomWeb
{

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
    if (mBody != nullptr) {
        const Result taken = mBody->next(block);
        mPacking->pass(block);
        if (taken.good() && block.isEmpty()) {
            mBody.reset();
            block = mPacking->end();
        }
        return taken;
    }
    if (!mEntries.empty()) {
        Entry& entry = mEntries.front();
        block = mPacking->begin(entry.name, entry.mediaType);
        mBody = std::make_unique<BodyBlocks>(std::move(entry.body));
        mEntries.pop_front();
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

}  // namespace Kdd::DicomWeb
