#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"

namespace Kdd
{

/// Makes the level with the smallest key the current one; of equal keys the nearer node's is taken.
void TagMap::iterator::choose()
{
    const DcmTagKey* smallest = nullptr;
    mCurrent = 0;
    for (int i = 0; i < mCount; ++i) {
        if (!mLevels[i].atEnd() && (smallest == nullptr || mLevels[i].at.key() < *smallest)) {
            smallest = &mLevels[i].at.key();
            mCurrent = i;
        }
    }
}

void TagMap::iterator::step()
{
    // Every level moves on past the key, so that a value that a nearer node replaces is not seen after it.
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
    // The end has no levels, so that making one costs nothing; it equals every walk that is over.
    if (atEnd() || other.atEnd())
        return atEnd() && other.atEnd();
    return mLevels[mCurrent].at == other.mLevels[other.mCurrent].at;
}

/// Three levels cover a study's tree: image, series and study, or the items that hang below each other there.
TagMap::iterator TagMap::begin() const
{
    iterator it;
    for (const TagMap* node = this; node != nullptr && it.mCount < iterator::kLevels; node = node->mParent)
        it.mLevels[it.mCount++] = {node->tagsForLevel().cbegin(), node->tagsForLevel().cend()};
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
        it.mLevels[it.mCount++] = {node->tagsForLevel().lowerBound(key), node->tagsForLevel().cend()};
    it.choose();
    it.skipMissing();
    return it;
}

}  // namespace Kdd
