#pragma once

#include "kddlib/tagmodel/TagElement.h"

#include <QList>

namespace Kdd
{

class TagMap;

/// A sequence attribute: an ordered list of item maps. VR SQ, no value bytes of its own.
///
/// Owns its items. A copy made by construction or assignment shares the items without owning them, so it must not
/// outlive its source; `clone()` is the deep copy.
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

    /// Appends the item and takes it over.
    void addItem(TagMap* item) { mItems.append(item); }

    int numItems() const { return mItems.size(); }

    /// Owned by the sequence; 0 <= i < numItems().
    TagMap* item(int i) const { return mItems.at(i); }

    /// Deletes every item.
    void clear();

    /// Deletes the items after the first `count`.
    void truncate(int count);

private:
    void release();

    QList<TagMap*> mItems;
    bool mOwnsItems = true;
};

}  // namespace Kdd
