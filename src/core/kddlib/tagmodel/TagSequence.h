#pragma once

#include "kddlib/tagmodel/TagElement.h"

#include <QList>

namespace Kdd
{

class TagMap;

/// A sequence attribute: an ordered list of item maps. VR SQ, no value bytes of its own.
///
/// Owns its items. A copy made by construction or assignment shares the items without owning them, so it must not
/// outlive its source, nor what its source does to them; what is added to the copy is the copy's own. `clone()` is the
/// deep copy. Used by the thread that uses the tree.
class KDD_EXPORT TagSequence : public TagElement
{
public:
    TagSequence()
        : TagElement(VrCode::SQ, QByteArray())
    {
    }
    TagSequence(const TagSequence& other);
    TagSequence& operator=(const TagSequence& other);
    ~TagSequence() override;

    /// Whether `other` is a sequence of as many items that are equal pairwise; the first pair that differs ends it.
    bool compare(const TagElement& other, bool checkVR, std::string* diffs) const override;

    /// A `DcmSequenceOfItems` of all items, inherited values included, without what was omitted; the caller owns it.
    DcmElement* createDcmElement(const DcmTagKey& key) const override;

    TagElement* clone() const override;
    bool isSequence() const override { return true; }

    /// Appends the item and takes it over: from now on it is an item, and goes with the sequence. One that belongs to a
    /// sequence already is not taken from it, a copy is appended; one that hangs below a node that owns it takes along
    /// all it shows. Null stands for an item that is not there.
    void addItem(TagMap* item);

    int numItems() const { return mItems.size(); }

    /// Owned by the sequence; 0 <= i < numItems(). Null only where null was added.
    TagMap* item(int i) const { return mItems.at(i); }

    /// The same, an empty map for an item that is not there.
    const TagMap& itemToRead(int i) const;

    /// Deletes every item; a copy only lets go of those that it shares.
    void clear() { truncate(0); }

    /// The same for the items after the first `count`.
    void truncate(int count);

private:
    friend class TagMap;

    void swapItems(TagSequence& other);

    QList<TagMap*> mItems;
    int mShared = 0;  // of the items, that many at the head belong to another sequence
};

}  // namespace Kdd
