#include "kddlib/Limits.h"
#include "kddlib/tagmodel/KeptValues.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"
#include "platform/base/LogFile.h"

#include <dcmtk/dcmdata/dcdatset.h>
#include <dcmtk/dcmdata/dcelem.h>
#include <dcmtk/dcmdata/dcpixel.h>
#include <dcmtk/dcmdata/dcsequen.h>
#include <dcmtk/dcmdata/dcxfer.h>

#include <memory>

namespace Kdd
{

namespace
{

/// DCMTK gives encapsulated pixel data the length 0, and asking it for the value would read 4 GiB.
bool isEncapsulated(DcmElement& element)
{
    if (element.ident() != EVR_PixelData)
        return false;
    E_TransferSyntax xfer = EXS_Unknown;
    const DcmRepresentationParameter* parameter = nullptr;
    static_cast<DcmPixelData&>(element).getOriginalRepresentationKey(xfer, parameter);
    return DcmXfer(xfer).isEncapsulated() || element.getLengthField() == DCM_UndefinedLength;
}

/// Asking a text for its length loads it, so the length in the file is asked first.
bool isLongerThan(DcmElement& element, unsigned int bound)
{
    return isEncapsulated(element) || element.getLengthField() > kLargeValueBound + 1 ||
           element.getLength(EXS_LittleEndianImplicit, EET_UndefinedLength) > bound;
}

/// DCMTK hands out null for a text without characters; that is an empty value and no missing one.
OFCondition copyText(DcmElement& element, QByteArray& value)
{
    char* text = nullptr;
    const OFCondition condition = element.getString(text);
    if (condition.good())
        value = QByteArray(text);
    return condition;
}

OFCondition copyBytes(DcmElement& element, QByteArray& value)
{
    const Uint32 length = element.getLengthField();
    QByteArray bytes(static_cast<int>(length), Qt::Uninitialized);
    OFCondition condition = EC_Normal;
    if (length > 0)
        condition = element.getPartialValue(bytes.data(), 0, length, nullptr, gLocalByteOrder);
    if (condition.good())
        value = bytes;
    return condition;
}

OFCondition copyValue(DcmElement& element, TagElement& copy)
{
    copy.setVr(vrCodeOf(element.getVR()));
    return isTextVr(copy.vr()) ? copyText(element, copy.value()) : copyBytes(element, copy.value());
}

}  // namespace

TagMap* TagMap::createTagMap(DcmItem* item, unsigned int maxLength)
{
    return createTagMap(item, maxLength, 0);
}

TagMap* TagMap::createTagMap(DcmItem* item, unsigned int maxLength, int depth)
{
    auto map = std::make_unique<TagMap>();
    for (DcmObject* object = item->nextInContainer(nullptr); object != nullptr;
         object = item->nextInContainer(object))
        map->addObject(*object, maxLength, depth);
    if (item->ident() == EVR_dataset) {
        const E_TransferSyntax xfer = static_cast<DcmDataset*>(item)->getOriginalXfer();
        // A dataset built in memory has none. As one byte its -1 would pass for an encapsulated syntax.
        if (xfer != EXS_Unknown)
            map->putAndInsertValue(kTransferSyntax, VrCode::OB, QByteArray(1, static_cast<char>(xfer)));
    }
    return map.release();
}

void TagMap::addObject(DcmObject& object, unsigned int maxLength, int depth)
{
    const DcmTagKey key(object.getGTag(), object.getETag());
    // Group 0 belongs to messages, not to objects. Element 0 is the group's length, which is wrong as
    // soon as one value of the group is left out.
    if (key.getGroup() == 0 || key.getElement() == 0 || isOwnAttribute(key))
        return;
    if (object.ident() == EVR_SQ)
        addSequence(static_cast<DcmSequenceOfItems&>(object), maxLength, depth);
    else if (object.isLeaf())
        addElement(static_cast<DcmElement&>(object), maxLength);
}

void TagMap::addSequence(DcmSequenceOfItems& sequence, unsigned int maxLength, int depth)
{
    const DcmTagKey key(sequence.getGTag(), sequence.getETag());
    const bool isPrivate = (key.getGroup() & 1) != 0;
    if (depth >= kMaxItemDepth) {
        LogFile::warnf("Sequence (%04x,%04x) lies deeper than %d items and is left out",
                       unsigned(key.getGroup()), unsigned(key.getElement()), kMaxItemDepth);
        markAsOmitted(key);
    } else if (isPrivate && sequence.getLength(EXS_LittleEndianImplicit, EET_UndefinedLength) > maxLength) {
        // A private sequence is measured as a whole; of a public one only
        // the values that are too long are left out.
        markAsOmitted(key);
    } else {
        setSequence(&sequence, isLookupTableSequence(key) ? kLargeValueBound : maxLength, depth);
    }
}

void TagMap::addElement(DcmElement& element, unsigned int maxLength)
{
    const DcmTagKey key(element.getGTag(), element.getETag());
    auto copy = std::make_unique<TagElement>(VrCode::Omitted, QByteArray());
    if (!isLongerThan(element, hasLargeBound(key) ? kLargeValueBound : maxLength)) {
        const OFCondition condition = copyValue(element, *copy);
        if (condition.bad()) {
            // An empty value in its place would be a wrong one.
            LogFile::warnf("Value of (%04x,%04x) cannot be read and is left out: %s",
                           unsigned(key.getGroup()), unsigned(key.getElement()), condition.text());
            copy = std::make_unique<TagElement>(VrCode::Omitted, QByteArray());
        }
    }
    putInOrder(key, copy.release());
}

TagElement* TagMap::setElement(DcmElement* element)
{
    const DcmTagKey key(element->getGTag(), element->getETag());
    // Copied aside, because reading may fail; callers hold on to the element, so one that is there is changed in place.
    TagElement* held = ownElement(key);
    auto copy = std::make_unique<TagElement>(VrCode::UN, held != nullptr ? held->value() : QByteArray());
    // NOLINTNEXTLINE(clang-analyzer-unix.Malloc): a condition frees the text it owns
    const OFCondition condition = copyValue(*element, *copy);
    // A sequence is an object of another class and can only be
    // replaced, which an unreadable value must not do.
    if (held == nullptr || (held->isSequence() && condition.good()))
        return putElement(key, copy.release());
    if (!held->isSequence()) {
        held->putValue(copy->value());
        held->setVr(copy->vr());
    }
    return held;
}

TagSequence* TagMap::setSequence(DcmSequenceOfItems* sequence, unsigned int maxLength)
{
    return setSequence(sequence, maxLength, 0);
}

TagSequence* TagMap::setSequence(DcmSequenceOfItems* sequence, unsigned int maxLength, int depth)
{
    auto copy = std::make_unique<TagSequence>();
    // Stepping from item to item: looking items up by number would start at the head of DCMTK's list each time.
    for (DcmObject* object = sequence->nextInContainer(nullptr); object != nullptr;
         object = sequence->nextInContainer(object)) {
        copy->addItem(createTagMap(static_cast<DcmItem*>(object), maxLength, depth + 1));
    }
    const DcmTagKey key(sequence->getTag());
    if (holdsSequence(key)) {
        auto* held = static_cast<TagSequence*>(ownElement(key));
        held->swapItems(*copy);
        return held;
    }
    TagSequence* put = copy.get();
    putInOrder(key, copy.release());
    return put;
}

void TagMap::insertInto(DcmItem& item) const
{
    const iterator last = end();
    for (iterator it = begin(); it != last; ++it) {
        if (it.value()->markedAsOmitted())
            continue;
        std::unique_ptr<DcmElement> element(it.value()->createDcmElement(it.key()));
        // The item owns the element from the moment it has taken it; what it refuses goes with the pointer.
        if (element != nullptr && item.insert(element.get()).good())
            static_cast<void>(element.release());
    }
}

}  // namespace Kdd
