#pragma once

#include "kddlib/items/kdditem.h"

#include <vector>

class DcmItem;

namespace Kdd
{

class SequenceOfItemsOF;

/// An item of a DCMTK dataset, or a whole one. Answers are DCMTK's own unless said otherwise here. Used by one thread
/// at a time.
class KDD_EXPORT ItemOF : public Item
{
public:
    /// `item` must outlive this object.
    explicit ItemOF(DcmItem& item);

    /// Keeps the dataset, which must not be null, alive.
    explicit ItemOF(std::shared_ptr<DcmDataset> dataset);

    /// The one given at construction; empty for an item.
    std::shared_ptr<DcmDataset> obtainDcmDataset() override { return mDataset; }

    /// Both ask the Pixel Data of this item for the form in which it was read: false and EXS_Unknown without it.
    bool isEncapsulated() override;
    E_TransferSyntax transferSyntax() override;

    bool tagExists(const DcmTagKey& key, DcmEVR& vr) override;
    bool tagExists(const DcmTagKey& key) override;
    OFCondition findAndGetOFString(const DcmTagKey& key, OFString& value) override;
    OFCondition findAndGetOFStringArray(const DcmTagKey& key, OFString& value) override;
    OFCondition findAndGetLongInt(const DcmTagKey& key, long& value) override;

    /// EC_Normal for every attribute that is there; 0 when its value is no 16-bit number.
    OFCondition findAndGetUint16(const DcmTagKey& key, Uint16& value) override;

    OFCondition findAndGetSint16Array(const DcmTagKey& key, const Sint16*& values,
                                      unsigned long* count = nullptr) override;
    OFCondition findAndGetUint16Array(const DcmTagKey& key, const Uint16*& values,
                                      unsigned long* count = nullptr) override;
    OFCondition findAndGetUint8Array(const DcmTagKey& key, const Uint8*& values,
                                     unsigned long* count = nullptr) override;
    OFCondition findAndGetFloat32Array(const DcmTagKey& key, const Float32*& values,
                                       unsigned long* count = nullptr) override;
    OFCondition findAndGetSequence(const DcmTagKey& key, SequenceOfItems*& sequence) override;

    /// EC_IllegalCall for an index out of range.
    OFCondition findAndGetSequenceItem(const DcmTagKey& key, Item*& item, int index = 0) override;

    /// Replaces the element by one of the dictionary's value representation.
    OFCondition putAndInsertStringArray(const DcmTagKey& key, const char* value) override;

    DcmItem& dcmItem() const { return *mItem; }

private:
    DcmItem* mItem;
    std::shared_ptr<DcmDataset> mDataset;
    std::vector<std::shared_ptr<SequenceOfItemsOF>> mSequences;
};

/// The items of a DCMTK sequence, which must outlive this object and keep its items. Used by one thread at a time.
class KDD_EXPORT SequenceOfItemsOF : public SequenceOfItems
{
public:
    explicit SequenceOfItemsOF(DcmSequenceOfItems* sequence)
        : mSequence(sequence)
    {
    }

    unsigned int card() override;
    Item* getItem(unsigned int index) override;
    DcmSequenceOfItems* createDcmSequenceOfItems() override;

    const DcmSequenceOfItems* dcmSequence() const { return mSequence; }

private:
    DcmSequenceOfItems* mSequence;
    std::vector<std::shared_ptr<ItemOF>> mItems;
};

}  // namespace Kdd
