#pragma once

#include "kddlib/items/kdditem.h"

#include <dcmtk/dcmdata/dctagkey.h>

#include <vector>

namespace Kdd
{

class SequenceOfItemsTM;
class TagMap;
class TagSequence;

/// An image or a sequence item in the cache: a node with all it inherits from its series and study.
///
/// Answers are those of a dataset, with these exceptions. Texts of OB, OW and UN values have the form of
/// `TagElement::getValueAsString`, shortened when they are long. Arrays and `findAndGetUint16` read the value's bytes
/// whatever its value representation. Where the dataset's condition for an empty number is an error, texts and arrays
/// are just empty. An attribute that the cache knows of without keeping its value is there with an empty value, be it
/// a sequence or not; the dataset has it. Used by one thread at a time.
class KDD_EXPORT ItemTM : public Item
{
public:
    /// `map` must outlive this object.
    explicit ItemTM(TagMap& map);

    /// Keeps `mapOwner`, the study above `map`, alive.
    ItemTM(TagMap& map, std::shared_ptr<TagMap> mapOwner);

    /// Loads the image's DICOM file, whose path is (0006,7100), and keeps the dataset for later calls. Empty when that
    /// fails, which is logged once: the path is then emptied.
    std::shared_ptr<DcmDataset> obtainDcmDataset() override;

    /// By the transfer syntax of the dataset that the node was made from, (0006,7102); false and EXS_Unknown without
    /// it. Every one after the uncompressed ones counts as encapsulated, that of a deflated dataset too.
    bool isEncapsulated() override;
    E_TransferSyntax transferSyntax() override;

    /// `vr` is EVR_UNKNOWN for a value that the cache does not keep.
    bool tagExists(const DcmTagKey& key, DcmEVR& vr) override;
    bool tagExists(const DcmTagKey& key) override;
    OFCondition findAndGetOFString(const DcmTagKey& key, OFString& value) override;
    OFCondition findAndGetOFStringArray(const DcmTagKey& key, OFString& value) override;

    /// EC_ValueRepresentationViolated, and 0, when `TagElement::valueAsInt` finds no number; several in one text are
    /// none.
    OFCondition findAndGetLongInt(const DcmTagKey& key, long& value) override;

    /// EC_ValueRepresentationViolated for a value shorter than two bytes.
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

    /// "index out of range" (module 1000, code 1) for an index out of range.
    OFCondition findAndGetSequenceItem(const DcmTagKey& key, Item*& item, int index = 0) override;

    /// Changes the value where it is held, be that above this node, for all nodes that inherit it; a sequence or a list
    /// of bytes stays as it is. A value that is not there or not kept becomes this node's own, with the dictionary's
    /// value representation, or LO where the dictionary has none or one that texts cannot be converted to. Always
    /// EC_Normal.
    OFCondition putAndInsertStringArray(const DcmTagKey& key, const char* value) override;

    /// The node served.
    TagMap& tagMap() const { return *mMap; }

private:
    TagMap* mMap;
    std::shared_ptr<TagMap> mMapOwner;
    std::vector<std::shared_ptr<SequenceOfItemsTM>> mSequences;
    std::shared_ptr<DcmDataset> mDataset;
};

/// The items of a sequence in the cache. Used by one thread at a time.
class KDD_EXPORT SequenceOfItemsTM : public SequenceOfItems
{
public:
    /// `sequence` must outlive this object.
    SequenceOfItemsTM(const DcmTagKey& key, TagSequence* sequence)
        : mSequence(sequence)
        , mKey(key)
    {
    }

    unsigned int card() override;
    Item* getItem(unsigned int index) override;

    /// With what the items inherit, without what the cache does not keep.
    DcmSequenceOfItems* createDcmSequenceOfItems() override;

    const TagSequence* tagSequence() const { return mSequence; }

private:
    TagSequence* mSequence;
    std::vector<std::shared_ptr<ItemTM>> mItems;
    DcmTagKey mKey;
};

}  // namespace Kdd
