#pragma once

#include "kddlib/tagmodel/VolumeHolder.h"
#include "kddlib/tagmodel/VrCode.h"
#include "platform/base/Export.h"

#include <QByteArray>
#include <QExplicitlySharedDataPointer>
#include <QList>
#include <QMap>
#include <QVector>

#include <dcmtk/dcmdata/dctagkey.h>

#include <atomic>
#include <memory>
#include <string>
#include <vector>

class DcmElement;
class DcmItem;
class DcmObject;
class DcmSequenceOfItems;
class DcmTag;
class QString;
class QTextStream;

namespace Kdd
{

class EncodedElements;
class KxMsg;
class TagElement;
class TagSequence;
class VolumeImages;

/// One node of a study's tree: the study, a series, an image, or an item of a sequence.
///
/// A node stores only what differs from its ancestors: what all images of a series share is held once by the series,
/// and every image inherits it. Look-ups and iteration see the merged view of a node and its ancestors; an element
/// marked missing hides an inherited value.
///
/// A node owns its elements, its volumes and, unless it is a sequence item, its children. An item belongs to its
/// sequence; it may hang below the item of the same index in the same sequence of a node above and then inherits from
/// it. An item whose parent item goes away first takes over all it inherited.
///
/// Maps made by the copy constructor or assignment share elements, children and volumes with their source without
/// owning them and must not outlive it; `clone()` is the deep copy. Used by one thread at a time.
///
/// A node that was read from a tag file takes its elements out of the file's bytes when they are first asked for.
class KDD_EXPORT TagMap
{
public:
    /// The level of a child; levels 1 to 3 have a UID attribute that always stays in the child's own map.
    enum Level {
        ItemLevel = 0,    ///< sequence item, no UID
        ImageLevel = 1,   ///< SOP Instance UID (0008,0018)
        SeriesLevel = 2,  ///< Series Instance UID (0020,000E)
        StudyLevel = 3,   ///< Study Instance UID (0020,000D)
    };

    using Tags = QMap<DcmTagKey, TagElement*>;

    class iterator;

    TagMap() = default;
    TagMap(const TagMap& other);
    TagMap& operator=(const TagMap& other);
    ~TagMap();

    // ---- the tree

    TagMap* parent() const { return mParent; }
    const QList<TagMap*>& children() const { return mChildren; }
    bool isSequenceItem() const { return mIsSequenceItem; }

    /// The node's own elements only. Whoever takes an element out owns it.
    Tags& tagsForLevel()
    {
        if (isEncoded())
            decode();
        return mTags;
    }
    const Tags& tagsForLevel() const
    {
        if (isEncoded())
            decode();
        return mTags;
    }

    /// Attaches `child` and takes it over (an item stays with its sequence). What the child shares with this node is
    /// dropped from the child, what it lacks is marked missing in it; a first child gives all it has to this node.
    /// What every node shows stays the same. The UID element of `level` stays in the child. A child that hangs elsewhere
    /// leaves its parent with all it shows; one that hangs here already stays as it is.
    void addChildMap(TagMap* child, Level level);

    /// Takes the pointer out of the children; false if it is not there. The child is neither deleted nor changed: its
    /// parent pointer stays and what it inherited is not copied back. The caller owns it, and asks it for nothing once
    /// the parent is gone.
    bool removeChildMap(TagMap* child);

    /// A deep copy of the merged view: no parent, no children, no volumes. The caller owns it.
    TagMap* clone() const;

    /// Makes every item of the own sequences stand alone: it takes over what it inherits and lets go of its parent.
    /// To be called before a node leaves its tree.
    void detachItems();

    /// Makes every item below this node hang where a reader of the tag file will hang it: below the item of the same
    /// index in the sequence that the node above shows under the same key. What every item shows stays the same.
    void relinkItems();

    // ---- from and to DICOM

    /// A new map without parent of every attribute of the item; the caller owns it. Group lengths and what stands
    /// under our own keys (0006,71xx) are left out. A
    /// value longer than `maxLength` [bytes] is marked as omitted, with a larger bound for overlays, curves, look-up
    /// tables and graphics; so are encapsulated pixel data and sequences nested deeper than `kMaxItemDepth`. A data
    /// set's original transfer syntax, if it has one, becomes the one byte of (0006,7102).
    static TagMap* createTagMap(DcmItem* item, unsigned int maxLength);

    /// Copies one DCMTK element into the own map. Its value stays as it was when DCMTK cannot give it, a sequence that
    /// the key holds as a whole.
    TagElement* setElement(DcmElement* element);

    /// Copies one DCMTK sequence into the own map. A sequence that the key holds already gets the new items in place of
    /// its own.
    TagSequence* setSequence(DcmSequenceOfItems* sequence, unsigned int maxLength);

    /// Inserts the merged view into a DCMTK item, without what is missing or omitted.
    void insertInto(DcmItem& item) const;

    // ---- look-up

    /// The element that this node shows under the key; null when there is none or it is marked missing. Owned by the
    /// node that holds it.
    TagElement* findElement(const DcmTagKey& key) const;

    /// As above; a tag with a private creator is looked up through it, any other by its base tag (repeating groups
    /// such as (60xx,3000) folded).
    TagElement* findElement(const DcmTag& tag) const;

    /// `key` inside the sequence item named by a path such as "ReferencedSeriesSequence[1].(0008,1199)[0]"; an empty
    /// path is this node. Null when a part of the path does not resolve or the index is out of range.
    TagElement* findElement(const QString& path, const DcmTagKey& key) const;

    /// The creator text of a private key's block, or null. Owned by the creator element.
    const char* privateCreator(const DcmTagKey& key) const;

    /// The UID that this node shows for a level; empty when it has none. A few writers store every attribute as UN,
    /// UIDs included; they are read as what they are.
    QByteArray uid(Level level) const;

    /// The first value as a number; false and 0 when there is none.
    bool findAndGetInt(const DcmTagKey& key, int& value) const;

    /// The value as text (`TagElement::getValueAsString`); false when nothing is found. Values of VR UN under a
    /// private key are written by the VR that the dictionary has for their creator.
    bool findAndGetString(const DcmTagKey& key, QByteArray& text) const;
    bool findAndGetString(const DcmTagKey& key, const char* creator, QByteArray& text) const;

    // ---- change; all of them work on the own map. What is given may be part of this tree, also of what is replaced.

    /// Stores a number; its size decides the VR. False, and nothing changed, when the key holds a sequence: its items
    /// would be lost for a value that cannot mean them. Whoever wants that deletes the element first.
    bool putAndInsertInt(const DcmTagKey& key, int value);

    /// Stores a text in the encoding of the element's VR; a new element, or a marker, takes its VR from the
    /// dictionary (UN when it knows none). Always true, also where `TagElement::putValueAsString` refuses the VR and
    /// the element, a sequence for example, stays as it was.
    bool putAndInsertString(const DcmTagKey& key, const QByteArray& text);
    bool putAndInsertString(const DcmTagKey& key, const char* creator, const QByteArray& text);

    /// Stores bytes and their VR. False, and nothing changed, when the key holds a sequence, as for a number.
    bool putAndInsertValue(const DcmTagKey& key, VrCode vr, const QByteArray& bytes);

    /// Stores a private value in the creator's block, which is reserved when it is new. False, and nothing changed, for
    /// an even group, when no block is free and when a sequence stands in the value's place.
    bool putAndInsertValue(const DcmTagKey& key, const char* creator, VrCode vr, const QByteArray& bytes);

    /// Puts an element of its own under the key in place of an earlier one, be it a sequence, and takes it over.
    TagElement* putElement(const DcmTagKey& key, TagElement* element);

    bool deleteElement(const DcmTagKey& key);
    TagElement* markAsMissing(const DcmTagKey& key);
    TagElement* markAsOmitted(const DcmTagKey& key);

    // ---- the merged view in key order

    iterator begin() const;
    iterator end() const;

    /// The first entry whose key is not less than `key`.
    iterator lowerBound(const DcmTagKey& key) const;

    // ---- placement between this node and its children

    /// Moves one attribute to where it costs the tag file the fewest bytes; sequences stay where they are. What
    /// every node shows stays the same.
    void optimize(const DcmTagKey& key);

    /// `optimize` for every key held here or by a child.
    void optimizeAll();

    /// Every child holds its own value, this node none.
    void storeOptionA(const DcmTagKey& key);

    /// This node holds the value, children only what differs. Children are compared by their bytes; a sequence equals
    /// no value. By value, because it may be that of a child that loses it.
    void storeOptionB(const DcmTagKey& key, VrCode vr, QByteArray value);

    /// Deletes what clients never use (values of VR UN, look-up tables, overlays, all but four items of the Original
    /// Attributes Sequence, the suffixes of volume files), here and below.
    void removeTagsNotNeededByClient();

    // ---- text and comparison

    /// Compares the merged views. Unless `strict`, groups 0006 and 0071 and private values are passed over and VRs
    /// may differ. The first difference ends it and is described in `diffs` if that is not null.
    bool compare(const TagMap& other, bool strict, std::string* diffs) const;

    /// Writes the merged view in the manner of a DICOM dump.
    void dump(QTextStream& out, int indent) const;

    /// Writes the node's own entries with lengths and attribute names; a missing marker shows as "--".
    void listContent(QTextStream& out, int indent) const;

    // What follows, but for the upkeep of the volumes' list, is defined by the rooms above: they know what a preview, a
    // volume and a record is, and the tag model never asks.

    // ---- previews

    /// The JPEG that represents this node best: its own or its parent's, that of the volume with the most slices
    /// below, or the first of an image. `owner`, if not null, receives the image it belongs to. Empty when there is
    /// none.
    QByteArray findPreviewData(TagMap** owner);

    // ---- volumes

    /// Until the next volume comes or goes.
    const QList<Volume*>& volumes() const;

    /// Takes the volume over; one that is here already stays where it is. An index that is negative becomes the number
    /// of volumes.
    void addBareVolume(Volume* volume);

    /// Deletes the volumes; a copy only lets go of them.
    void clearVolumes();

    // ---- tag file records

    /// Appends the node's own elements as one record with its length. Previews go to `blobs`. The message has failed
    /// afterwards when the node holds more, or nests deeper, than `deserialize` reads.
    void serialize(KxMsg& out, QList<QByteArray>& blobs) const;

    /// Reads elements until the message is used up; `parent` is the node that this map will hang under. The message
    /// has failed afterwards when it was damaged; the map then holds what was read before.
    void deserialize(KxMsg& in, TagMap* parent, const QList<QByteArray>& blobs);

    /// Appends the volumes as one record. The message has failed afterwards when they name more images than
    /// `deserializeVolumes` reads.
    void serializeVolumes(KxMsg& out, QList<QByteArray>& blobs) const;
    void deserializeVolumes(KxMsg& in, const QList<QByteArray>& blobs);

    /// Lengths below 65535 take two bytes, others six.
    static void writeLength(KxMsg& out, int length);
    static int readLength(KxMsg& in);

protected:
    friend class DatabaseValues;
    friend class StudyBodyReader;
    friend class StudyBodyWriter;
    friend class StudyMerge;
    friend class StudyTree;
    friend class TagSequence;
    friend class VolumeImages;
    friend class VolumeSettling;

    /// Hangs a child below this node as it is, and takes it over: it inherits all it does not hold, and neither node
    /// gives or loses an attribute.
    void appendChild(TagMap* child);

    void insertUID(Level level, TagElement* uid);
    TagElement* removeUID(Level level);
    TagElement* findElementPrivate(const DcmTagKey& key, const char* creator) const;

    /// Gives this node a copy of every element of its parent's own map that it lacks.
    void copyFromParent();

private:
    enum class Match { Bytes, BytesAndVr };
    struct Held;
    class HeldValues;

    /// Leaves the own elements, of which there are none yet, where they stand until they are asked for. None of their
    /// sequences may have items that inherit.
    void keepEncoded(const EncodedElements& elements, int place);
    bool isEncoded() const { return mEncoded.load(std::memory_order_acquire) != nullptr; }
    QExplicitlySharedDataPointer<const EncodedElements> encoded() const;
    void decode() const;
    void dropEncoded();
    bool holdsEncoded(const DcmTagKey& key) const;
    const TagElement* findValue(const DcmTagKey& key, TagElement& copy) const;

    static TagMap* createTagMap(DcmItem* item, unsigned int maxLength, int depth);
    TagSequence* setSequence(DcmSequenceOfItems* sequence, unsigned int maxLength, int depth);
    void addObject(DcmObject& object, unsigned int maxLength, int depth);
    void addSequence(DcmSequenceOfItems& sequence, unsigned int maxLength, int depth);
    void addElement(DcmElement& element, unsigned int maxLength);

    /// What a sequence appends for this map: the map itself, or a copy when it is another sequence's already.
    TagMap* becomeItem();
    bool hangs() const { return mParent != nullptr && !mIsTakenOut; }

    void adoptFrom(TagMap* child);
    void dropWhatParentShows(const TagMap& parent);
    static void attachItems(const TagSequence& parentSequence, const TagSequence& childSequence);
    void standAlone();
    bool mayRelinkEncoded(const EncodedElements& elements) const;
    void relinkOwnItems();
    void hangBelow(TagMap* item);
    void forgetParent();
    void leaveVolumes();

    /// Takes the places of another image in its volumes; that one is in none of them any more.
    void takeVolumePlaces(TagMap& former);

    /// The volumes, to be changed.
    QList<Volume*>& obtainVolumes();
    void releaseAll();

    /// A node that does not hold the key stays encoded.
    TagElement* ownElement(const DcmTagKey& key) const
    {
        return isEncoded() && !holdsEncoded(key) ? nullptr : tagsForLevel().value(key, nullptr);
    }
    bool holdsSequence(const DcmTagKey& key) const;
    TagElement* plainElement(const DcmTagKey& key);
    void putInOrder(const DcmTagKey& key, TagElement* element);

    static bool equals(const TagElement& element, VrCode vr, const QByteArray& value, Match match);
    void storeHere(const DcmTagKey& key, VrCode vr, QByteArray value, Match match);
    void place(const DcmTagKey& key, const std::vector<Held>& held);
    void forgetUnseen(const DcmTagKey& key, bool childrenAreMarked);

    /// What the reading of one tag file's records shares.
    struct RecordContext
    {
        const QList<QByteArray>& blobs;
        int elementsLeft;
        int depth;
    };

    /// What the writing of one tag file's records shares: what may still be written, and why it may not.
    struct WriteContext
    {
        QList<QByteArray>& blobs;
        int elementsLeft;
        int depth;
        const char* refusal;
    };

    void serialize(KxMsg& out, WriteContext& context) const;
    static bool countElements(KxMsg& out, int count, WriteContext& context);
    static void writeAgain(KxMsg& out, const QByteArray& record, int count, WriteContext& context);
    static void writeElement(KxMsg& out, const DcmTagKey& key, const TagElement& element,
                             WriteContext& context);
    static void refuse(KxMsg& out, WriteContext& context, const char* reason);
    void deserialize(KxMsg& in, TagMap* parent, RecordContext& context);
    static std::unique_ptr<TagElement> readSequence(KxMsg& in, const DcmTagKey& key, const TagMap* parent,
                                                    RecordContext& context);

    /// Where a volume's list of images names this node.
    struct VolumePlace
    {
        VolumeImages* images;
        int place;
    };

    TagMap* mParent = nullptr;
    QList<TagMap*> mChildren;
    std::unique_ptr<VolumeHolder> mVolumes;  // null without volumes
    QVector<VolumePlace> mVolumePlaces;
    mutable Tags mTags;  // empty while encoded
    mutable std::atomic<const EncodedElements*> mEncoded{nullptr};
    int mPlace = 0;  // of the elements there
    bool mIsSequenceItem = false;
    bool mIsInSequence = false;  // an item may also be the copy of one, which belongs to no sequence
    bool mIsTakenOut = false;    // no child of `mParent` any more
    bool mOwns = true;
};

}  // namespace Kdd

#include "kddlib/tagmodel/TagMapIterator.h"
