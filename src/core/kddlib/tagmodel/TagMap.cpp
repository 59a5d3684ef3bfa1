#include "kddlib/tagmodel/TagMap.h"

#include "kddlib/tagmodel/TagElement.h"

#include <dcmtk/dcmdata/dcdicent.h>
#include <dcmtk/dcmdata/dcdict.h>
#include <dcmtk/dcmdata/dctag.h>

#include <cstring>

namespace Kdd
{

namespace
{

// A private creator reserves one of these blocks of its group by writing its name to (gggg,00bb); its
// values are then (gggg,bb00) to (gggg,bbff).
constexpr quint16 kFirstBlock = 0x10;
constexpr quint16 kLastBlock = 0xff;

bool isPrivate(const DcmTagKey& key)
{
    return (key.getGroup() & 1) != 0;
}

DcmTagKey creatorKey(const DcmTagKey& key, quint16 block)
{
    return {key.getGroup(), block};
}

/// A private attribute is known by its low byte. Which block it stands in is chosen anew by every writer.
DcmTagKey inBlock(const DcmTagKey& key, quint16 block)
{
    return {key.getGroup(), static_cast<Uint16>((block << 8) | (key.getElement() & 0xff))};
}

VrCode dictionaryVr(const DcmTagKey& key, const char* creator)
{
    const DcmDictEntry* entry = dcmDataDict.rdlock().findEntry(key, creator);
    const VrCode vr = entry != nullptr ? vrCodeOf(entry->getEVR()) : VrCode::UN;
    dcmDataDict.rdunlock();
    return vr;
}

/// The block that a private creator has reserved, and the first free one.
struct CreatorSearch
{
    quint16 found = 0;
    quint16 free = kFirstBlock;
};

/// Looks at the merged view, because a creator may stand at the series while its values stand at the images.
/// Keys ascend, so the first number that is skipped is the first free block.
CreatorSearch findCreator(const TagMap& map, const DcmTagKey& key, const char* creator)
{
    CreatorSearch search;
    const DcmTagKey last = creatorKey(key, kLastBlock);
    const TagMap::iterator end = map.end();
    for (TagMap::iterator it = map.lowerBound(creatorKey(key, kFirstBlock)); it != end && it.key() <= last;
         ++it) {
        // Up to the NUL and no trimming: a creator with a blank at its end is another one.
        if (std::strcmp(it.value()->value().constData(), creator) == 0) {
            search.found = it.key().getElement();
            break;
        }
        if (it.key().getElement() == search.free)
            ++search.free;
    }
    return search;
}

}  // namespace

TagElement* TagMap::findElement(const DcmTagKey& key) const
{
    for (const TagMap* node = this; node != nullptr; node = node->mParent) {
        if (TagElement* element = node->ownElement(key))
            return element->markedAsMissing() ? nullptr : element;
    }
    return nullptr;
}

TagElement* TagMap::findElement(const DcmTag& tag) const
{
    if (tag.getPrivateCreator() != nullptr)
        return findElementPrivate(tag, tag.getPrivateCreator());
    return findElement(tag.getBaseTag());
}

TagElement* TagMap::findElementPrivate(const DcmTagKey& key, const char* creator) const
{
    if (creator == nullptr)
        return findElement(key);
    if (!isPrivate(key))
        return nullptr;
    const CreatorSearch search = findCreator(*this, key, creator);
    return search.found != 0 ? findElement(inBlock(key, search.found)) : nullptr;
}

const char* TagMap::privateCreator(const DcmTagKey& key) const
{
    if (!isPrivate(key))
        return nullptr;
    const TagElement* creator = findElement(creatorKey(key, key.getElement() >> 8));
    return creator != nullptr ? creator->value().constData() : nullptr;
}

bool TagMap::findAndGetInt(const DcmTagKey& key, int& value) const
{
    bool ok = false;
    TagElement copy;
    const TagElement* element = findValue(key, copy);
    value = element != nullptr ? element->valueAsInt(&ok, 0) : 0;
    return ok;
}

bool TagMap::findAndGetString(const DcmTagKey& key, QByteArray& text) const
{
    TagElement copy;
    const TagElement* element = findValue(key, copy);
    if (element == nullptr)
        return false;
    if (element->vr() == VrCode::UN && isPrivate(key))
        element->getValueAsString(text, key, privateCreator(key));
    else
        element->getValueAsString(text);
    return true;
}

bool TagMap::findAndGetString(const DcmTagKey& key, const char* creator, QByteArray& text) const
{
    const TagElement* element = findElementPrivate(key, creator);
    if (element == nullptr)
        return false;
    if (element->vr() == VrCode::UN)
        element->getValueAsString(text, key, creator);
    else
        element->getValueAsString(text);
    return true;
}

TagElement* TagMap::putElement(const DcmTagKey& key, TagElement* element)
{
    // The former element goes last, when the key points at the new one already, for the new one may have been
    // made from it. What is put where it stands must not go at all.
    TagElement*& place = tagsForLevel()[key];
    const std::unique_ptr<TagElement> replaced(place != element ? place : nullptr);
    place = element;
    return element;
}

/// Data sets and records hold their keys in order, so the end of the map is nearly always the right place.
void TagMap::putInOrder(const DcmTagKey& key, TagElement* element)
{
    const Tags& own = tagsForLevel();
    if (own.isEmpty() || own.lastKey() < key)
        mTags.insert(mTags.cend(), key, element);
    else
        putElement(key, element);
}

bool TagMap::deleteElement(const DcmTagKey& key)
{
    if (isEncoded() && !holdsEncoded(key))
        return false;
    const auto at = tagsForLevel().find(key);
    if (at == mTags.end())
        return false;
    delete at.value();
    mTags.erase(at);
    return true;
}

TagElement* TagMap::markAsMissing(const DcmTagKey& key)
{
    return putElement(key, new TagElement(VrCode::Missing, QByteArray()));
}

TagElement* TagMap::markAsOmitted(const DcmTagKey& key)
{
    return putElement(key, new TagElement(VrCode::Omitted, QByteArray()));
}

bool TagMap::putAndInsertInt(const DcmTagKey& key, int value)
{
    if (holdsSequence(key))
        return false;
    plainElement(key)->putValue(value);
    return true;
}

bool TagMap::putAndInsertString(const DcmTagKey& key, const QByteArray& text)
{
    return putAndInsertString(key, nullptr, text);
}

/// The creator only finds the VR. The key is taken as it stands, block included.
bool TagMap::putAndInsertString(const DcmTagKey& key, const char* creator, const QByteArray& text)
{
    TagElement* element = ownElement(key);
    if (element == nullptr || element->markedAsMissing() || element->markedAsOmitted()) {
        // A new one, because the bytes that a marker hides must not come to light where the VR takes no text.
        auto made = std::make_unique<TagElement>(dictionaryVr(key, creator), QByteArray());
        made->putValueAsString(text);
        putElement(key, made.release());
    } else {
        element->putValueAsString(text);
    }
    return true;
}

bool TagMap::putAndInsertValue(const DcmTagKey& key, VrCode vr, const QByteArray& bytes)
{
    if (holdsSequence(key))
        return false;
    TagElement* element = plainElement(key);
    element->putValue(bytes);
    element->setVr(vr);
    return true;
}

bool TagMap::putAndInsertValue(const DcmTagKey& key, const char* creator, VrCode vr, const QByteArray& bytes)
{
    if (creator == nullptr)
        return putAndInsertValue(key, vr, bytes);
    if (!isPrivate(key))
        return false;
    const CreatorSearch search = findCreator(*this, key, creator);
    if (search.found != 0)
        return putAndInsertValue(inBlock(key, search.found), vr, bytes);
    // Everything is checked before the creator is written: a refusal must not leave a block reserved.
    const DcmTagKey target = inBlock(key, search.free);
    if (search.free > kLastBlock || holdsSequence(target) || holdsSequence(creatorKey(key, search.free)))
        return false;
    const QByteArray given = bytes;  // it may be what stands in the creator's place, hidden by a marker
    putAndInsertValue(creatorKey(key, search.free), VrCode::LO, QByteArray(creator));
    return putAndInsertValue(target, vr, given);
}

/// A sequence whose VR was made a marker shows nothing, so replacing it loses nothing.
bool TagMap::holdsSequence(const DcmTagKey& key) const
{
    const TagElement* own = ownElement(key);
    return own != nullptr && own->isSequence() && !own->markedAsMissing() && !own->markedAsOmitted();
}

/// Callers set bytes and VR, so a plain element serves again whatever it was, a marker included.
TagElement* TagMap::plainElement(const DcmTagKey& key)
{
    TagElement* element = ownElement(key);
    if (element == nullptr || element->isSequence())
        element = putElement(key, new TagElement);
    return element;
}

}  // namespace Kdd
