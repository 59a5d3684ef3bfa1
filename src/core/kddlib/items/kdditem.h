#pragma once

#include "platform/base/Export.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcvr.h>
#include <dcmtk/dcmdata/dcxfer.h>
#include <dcmtk/ofstd/ofcond.h>
#include <dcmtk/ofstd/ofstring.h>

#include <memory>

class DcmDataset;
class DcmSequenceOfItems;
class DcmTagKey;

namespace Kdd
{

class Item;

/// The items of a sequence attribute, wherever they come from. Used by one thread at a time.
class KDD_EXPORT SequenceOfItems
{
public:
    /// Number of items.
    virtual unsigned int card() = 0;

    /// The item at `index` (0-based), the same pointer at every call; null when there is none. Owned by this object.
    virtual Item* getItem(unsigned int index) = 0;

    /// A new DCMTK sequence of the same items; the caller owns it.
    virtual DcmSequenceOfItems* createDcmSequenceOfItems() = 0;

    virtual ~SequenceOfItems();

protected:
    SequenceOfItems() = default;
    SequenceOfItems(const SequenceOfItems&) = default;
    SequenceOfItems& operator=(const SequenceOfItems&) = default;
};

/// The attributes of an image or of a sequence item, read from a DICOM dataset (`ItemOF`) or from the cache (`ItemTM`).
///
/// Operations have the names, arguments and conditions of DCMTK's `DcmItem`, so that code written for a dataset runs
/// over the cache: EC_TagNotFound where the attribute is absent, EC_InvalidVR where a sequence is asked for and
/// the attribute is none. They never look into sequences. A result that cannot be given is set to zero, null or empty.
///
/// Sequences and items handed out belong to this object and are gone with it; asking twice gives the same pointer. A
/// copy shares them with its source, so that they live until both are gone. Arrays handed out are valid until the
/// attribute is changed. Used by one thread at a time.
class KDD_EXPORT Item
{
public:
    /// The full dataset; empty when there is none or it cannot be loaded.
    virtual std::shared_ptr<DcmDataset> obtainDcmDataset() = 0;

    /// Whether the pixels are compressed.
    virtual bool isEncapsulated() = 0;

    /// EXS_Unknown when it is not known.
    virtual E_TransferSyntax transferSyntax() = 0;

    /// Whether the attribute is there, even without a value. `vr` is left alone when it is not.
    virtual bool tagExists(const DcmTagKey& key, DcmEVR& vr) = 0;
    virtual bool tagExists(const DcmTagKey& key) = 0;

    /// The first value as text.
    virtual OFCondition findAndGetOFString(const DcmTagKey& key, OFString& value) = 0;

    /// All values as one text, separated by backslashes.
    virtual OFCondition findAndGetOFStringArray(const DcmTagKey& key, OFString& value) = 0;

    /// The first value as a number.
    virtual OFCondition findAndGetLongInt(const DcmTagKey& key, long& value) = 0;

    /// The first 16-bit value; a signed one is given with the same bits.
    virtual OFCondition findAndGetUint16(const DcmTagKey& key, Uint16& value) = 0;

    /// The values as they lie in memory; `count`, the number of values, may be null.
    virtual OFCondition findAndGetSint16Array(const DcmTagKey& key, const Sint16*& values,
                                              unsigned long* count = nullptr) = 0;
    virtual OFCondition findAndGetUint16Array(const DcmTagKey& key, const Uint16*& values,
                                              unsigned long* count = nullptr) = 0;
    virtual OFCondition findAndGetUint8Array(const DcmTagKey& key, const Uint8*& values,
                                             unsigned long* count = nullptr) = 0;
    virtual OFCondition findAndGetFloat32Array(const DcmTagKey& key, const Float32*& values,
                                               unsigned long* count = nullptr) = 0;

    virtual OFCondition findAndGetSequence(const DcmTagKey& key, SequenceOfItems*& sequence) = 0;

    /// The item at `index` (0-based) of a sequence. An index out of range, negative ones included, is an error.
    virtual OFCondition findAndGetSequenceItem(const DcmTagKey& key, Item*& item, int index = 0) = 0;

    /// Stores a text, values separated by backslashes, in the encoding of the attribute's value representation.
    virtual OFCondition putAndInsertStringArray(const DcmTagKey& key, const char* value) = 0;

    virtual ~Item();

protected:
    Item() = default;
    Item(const Item&) = default;
    Item& operator=(const Item&) = default;

    /// `findAndGetSequenceItem` with the condition for an index out of range.
    OFCondition findItem(const DcmTagKey& key, Item*& item, int index, const OFCondition& outOfRange);
};

}  // namespace Kdd
