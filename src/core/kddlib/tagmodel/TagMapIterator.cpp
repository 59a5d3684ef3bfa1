#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"

namespace Kdd
{

namespace
{

const DcmTagKey kBeyondEveryKey(0xffff, 0xffff);

}  // namespace

void TagMap::iterator::choose()
{
    const DcmTagKey* smallest = &kBeyondEveryKey;
    mCurrent = 0;
    for (int i = 0; i < mCount; ++i) {
        // Strictly smaller, so that of equal keys the nearer node's element is taken.
        if (!mLevels[i].atEnd() && mLevels[i].at.key() < *smallest) {
            smallest = &mLevels[i].at.key();
            mCurrent = i;
        }
    }
    if (smallest == &kBeyondEveryKey) {
        for (int i = 0; i < mCount; ++i)
            mLevels[i].at = mLevels[i].end;
    }
}

void TagMap::iterator::step()
{
    const DcmTagKey passed = key();
    for (int i = 0; i < mCount; ++i) {
        if (!mLevels[i].atEnd() && mLevels[i].at.key() <= passed)
            ++mLevels[i].at;
    }
    choose();
}

void TagMap::iterator::skipMissing()
{
    while (!atEnd() && value()->markedAsMissing())
        step();
}

TagMap::iterator& TagMap::iterator::operator++()
{
    step();
    skipMissing();
    return *this;
}

bool TagMap::iterator::operator==(const iterator& other) const
{
    if (atEnd() || other.atEnd())
        return atEnd() && other.atEnd();
    return mLevels[mCurrent].at == other.mLevels[other.mCurrent].at;
}

TagMap::iterator TagMap::begin() const
{
    iterator it;
    for (const TagMap* node = this; node != nullptr && it.mCount < iterator::kLevels; node = node->mParent)
        it.mLevels[it.mCount++] = {node->mTags.cbegin(), node->mTags.cend()};
    it.choose();
    it.skipMissing();
    return it;
}

// NOLINTNEXTLINE(readability-convert-member-functions-to-static): the pair of begin()
TagMap::iterator TagMap::end() const
{
    return {};
}

TagMap::iterator TagMap::lowerBound(const DcmTagKey& key) const
{
    iterator it;
    for (const TagMap* node = this; node != nullptr && it.mCount < iterator::kLevels; node = node->mParent)
        it.mLevels[it.mCount++] = {node->mTags.lowerBound(key), node->mTags.cend()};
    it.choose();
    it.skipMissing();
    return it;
}

}  // namespace Kdd
