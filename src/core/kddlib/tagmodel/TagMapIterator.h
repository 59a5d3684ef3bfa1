#pragma once

#include "kddlib/tagmodel/TagMap.h"

namespace Kdd
{

/// Walks the merged view of a node, its parent and its grandparent in key order, each key once with the nearest
/// node's element, missing ones skipped. Valid until one of the three own maps changes. Used by the thread that uses
/// the tree.
class KDD_EXPORT TagMap::iterator
{
public:
    iterator() = default;

    const DcmTagKey& key() const { return mLevels[mCurrent].at.key(); }
    TagElement* value() const { return mLevels[mCurrent].at.value(); }
    iterator& operator++();
    bool operator==(const iterator& other) const;
    bool operator!=(const iterator& other) const { return !(*this == other); }

private:
    friend class TagMap;

    static constexpr int kLevels = 3;

    struct Cursor
    {
        Tags::const_iterator at;
        Tags::const_iterator end;
        bool atEnd() const { return at == end; }
    };

    bool atEnd() const { return mCount == 0 || mLevels[mCurrent].atEnd(); }
    void choose();
    void step();
    void skipMissing();

    Cursor mLevels[kLevels];
    int mCount = 0;
    int mCurrent = 0;
};

}  // namespace Kdd
