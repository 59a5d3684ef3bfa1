#include "kddlib/items/kdditemof.h"

#include <dcmtk/dcmdata/dcdatset.h>
#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcpixel.h>
#include <dcmtk/dcmdata/dcsequen.h>

#include <algorithm>
#include <utility>

namespace Kdd
{

namespace
{

DcmPixelData* findPixelData(DcmItem& item)
{
    DcmElement* element = nullptr;
    const bool isFound = item.findAndGetElement(DCM_PixelData, element).good();
    return isFound ? dynamic_cast<DcmPixelData*>(element) : nullptr;
}

}  // namespace

ItemOF::ItemOF(DcmItem& item)
    : mItem(&item)
{
}

ItemOF::ItemOF(std::shared_ptr<DcmDataset> dataset)
    : mItem(dataset.get())
    , mDataset(std::move(dataset))
{
}

/// Asks for the form in which the pixels were read; a decoder may have added another one since.
bool ItemOF::isEncapsulated()
{
    DcmPixelData* pixels = findPixelData(*mItem);
    if (pixels == nullptr)
        return false;
    E_TransferSyntax syntax = EXS_Unknown;
    const DcmRepresentationParameter* parameter = nullptr;
    DcmPixelSequence* frames = nullptr;
    pixels->getOriginalRepresentationKey(syntax, parameter);
    return pixels->getEncapsulatedRepresentation(syntax, parameter, frames).good() && frames != nullptr;
}

E_TransferSyntax ItemOF::transferSyntax()
{
    E_TransferSyntax syntax = EXS_Unknown;
    const DcmRepresentationParameter* parameter = nullptr;
    if (DcmPixelData* pixels = findPixelData(*mItem))
        pixels->getOriginalRepresentationKey(syntax, parameter);
    return syntax;
}

bool ItemOF::tagExists(const DcmTagKey& key, DcmEVR& vr)
{
    DcmElement* element = nullptr;
    if (mItem->findAndGetElement(key, element).bad())
        return false;
    vr = element->getVR();
    return true;
}

bool ItemOF::tagExists(const DcmTagKey& key)
{
    return mItem->tagExists(key);
}

OFCondition ItemOF::findAndGetOFString(const DcmTagKey& key, OFString& value)
{
    return mItem->findAndGetOFString(key, value);
}

OFCondition ItemOF::findAndGetOFStringArray(const DcmTagKey& key, OFString& value)
{
    return mItem->findAndGetOFStringArray(key, value);
}

OFCondition ItemOF::findAndGetLongInt(const DcmTagKey& key, long& value)
{
    return mItem->findAndGetLongInt(key, value);
}

OFCondition ItemOF::findAndGetUint16(const DcmTagKey& key, Uint16& value)
{
    value = 0;
    DcmElement* element = nullptr;
    OFCondition condition = mItem->findAndGetElement(key, element);
    if (condition.bad())
        return condition;
    // What is signed or unsigned, such as a padding value, is asked for by its bits alone.
    if (element->getVR() == EVR_SS) {
        Sint16 number = 0;
        element->getSint16(number);
        value = static_cast<Uint16>(number);
    } else {
        element->getUint16(value);
    }
    return EC_Normal;
}

OFCondition ItemOF::findAndGetSint16Array(const DcmTagKey& key, const Sint16*& values, unsigned long* count)
{
    return mItem->findAndGetSint16Array(key, values, count);
}

OFCondition ItemOF::findAndGetUint16Array(const DcmTagKey& key, const Uint16*& values, unsigned long* count)
{
    return mItem->findAndGetUint16Array(key, values, count);
}

OFCondition ItemOF::findAndGetUint8Array(const DcmTagKey& key, const Uint8*& values, unsigned long* count)
{
    return mItem->findAndGetUint8Array(key, values, count);
}

OFCondition ItemOF::findAndGetFloat32Array(const DcmTagKey& key, const Float32*& values, unsigned long* count)
{
    return mItem->findAndGetFloat32Array(key, values, count);
}

OFCondition ItemOF::findAndGetSequence(const DcmTagKey& key, SequenceOfItems*& sequence)
{
    sequence = nullptr;
    DcmSequenceOfItems* found = nullptr;
    OFCondition condition = mItem->findAndGetSequence(key, found);
    if (condition.bad())
        return condition;
    // Asked for a second time, the same object is handed out, which callers rely on.
    auto at = std::find_if(mSequences.begin(), mSequences.end(),
                           [found](const auto& held) { return held->dcmSequence() == found; });
    if (at == mSequences.end())
        at = mSequences.insert(at, std::make_shared<SequenceOfItemsOF>(found));
    sequence = at->get();
    return condition;
}

OFCondition ItemOF::findAndGetSequenceItem(const DcmTagKey& key, Item*& item, int index)
{
    return findItem(key, item, index, EC_IllegalCall);
}

OFCondition ItemOF::putAndInsertStringArray(const DcmTagKey& key, const char* value)
{
    return mItem->putAndInsertOFStringArray(DcmTag(key), value != nullptr ? value : "");
}

unsigned int SequenceOfItemsOF::card()
{
    return static_cast<unsigned int>(mSequence->card());
}

Item* SequenceOfItemsOF::getItem(unsigned int index)
{
    // From the last one on: DCMTK looks an item up by its number by walking from the first.
    while (mItems.size() <= index) {
        DcmItem* last = mItems.empty() ? nullptr : &mItems.back()->dcmItem();
        DcmObject* next = mSequence->nextInContainer(last);
        if (next == nullptr)
            return nullptr;
        mItems.push_back(std::make_shared<ItemOF>(static_cast<DcmItem&>(*next)));
    }
    return mItems[index].get();
}

DcmSequenceOfItems* SequenceOfItemsOF::createDcmSequenceOfItems()
{
    return static_cast<DcmSequenceOfItems*>(mSequence->clone());
}

}  // namespace Kdd
