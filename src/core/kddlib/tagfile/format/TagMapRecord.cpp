#include "kddlib/Limits.h"
#include "kddlib/tagmodel/EncodedElements.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"
#include "platform/base/KxMsg.h"

#include <memory>

namespace Kdd
{

namespace
{

constexpr int kLengthEscape = 65535;
constexpr int kShortLength = 2;

const char* const kTooLarge = "Tag file would be larger than the format allows";

/// Writes what `write` appends as a record behind its length. The record goes straight to its place; only one that
/// outgrows the short length code is moved.
template <typename Write>
void writeRecord(KxMsg& out, Write write)
{
    const int start = out.position();
    out << quint16(0);
    write();
    if (out.failed())
        return;
    KxMsg length;
    TagMap::writeLength(length, out.position() - start - kShortLength);
    out.replace(start, kShortLength, length.bytes());
}

void writeKey(KxMsg& out, const DcmTagKey& key, VrCode vr)
{
    out << quint16(key.getGroup()) << quint16(key.getElement()) << static_cast<quint8>(vr);
}

void writeValue(KxMsg& out, const QByteArray& value)
{
    TagMap::writeLength(out, value.size());
    out.write(value);
}

/// What follows in the record goes by the VR, so the VR has to go by what the element really is.
VrCode storedVr(const TagElement& element)
{
    if (element.isSequence() && !element.markedAsMissing() && !element.markedAsOmitted())
        return VrCode::SQ;
    // A number that the one byte of the file does not hold would come back as another VR.
    const bool fits = static_cast<quint32>(element.vr()) <= static_cast<quint32>(VrCode::Omitted);
    return element.vr() == VrCode::SQ || !fits ? VrCode::UN : element.vr();
}

/// The preview that an index element stands for; null when the table has no such entry.
std::unique_ptr<TagElement> previewOf(const QByteArray& index, const QList<QByteArray>& blobs)
{
    bool ok = false;
    const int number = index.toInt(&ok, 10);
    if (!ok || number < 0 || number >= blobs.size())
        return nullptr;
    return std::make_unique<TagElement>(VrCode::OB, blobs.at(number));
}

}  // namespace

void TagMap::writeLength(KxMsg& out, int length)
{
    if (length < kLengthEscape)
        out << static_cast<quint16>(length);
    else
        out << static_cast<quint16>(kLengthEscape) << static_cast<qint32>(length);
}

int TagMap::readLength(KxMsg& in)
{
    quint16 length = 0;
    in >> length;
    if (length < kLengthEscape)
        return length;
    qint32 longLength = 0;
    in >> longLength;
    return longLength;
}

void TagMap::serialize(KxMsg& out, QList<QByteArray>& blobs) const
{
    WriteContext context{blobs, kMaxElements, 0, nullptr};
    serialize(out, context);
}

/// Counts as the reader does.
void TagMap::serialize(KxMsg& out, WriteContext& context) const
{
    if (const EncodedElements::Pointer elements = encoded()) {
        int count = 0;
        writeAgain(out, elements->record(mPlace, count), count, context);
        return;
    }
    const Tags& own = tagsForLevel();
    if (!countElements(out, 1 + own.size(), context))
        return;
    writeRecord(out, [&] {
        for (auto it = own.cbegin(); it != own.cend() && !out.failed(); ++it)
            writeElement(out, it.key(), *it.value(), context);
    });
}

bool TagMap::countElements(KxMsg& out, int count, WriteContext& context)
{
    context.elementsLeft -= count;
    if (context.elementsLeft < 0)
        refuse(out, context, "Tag file would hold more nodes, items and values than the format allows");
    return !out.failed();
}

/// A record as it was read.
void TagMap::writeAgain(KxMsg& out, const QByteArray& record, int count, WriteContext& context)
{
    if (!countElements(out, count, context))
        return;
    if (qint64(out.position()) + record.size() > kMaxBodySize)
        refuse(out, context, kTooLarge);
    else
        out.write(record);
}

void TagMap::refuse(KxMsg& out, WriteContext& context, const char* reason)
{
    context.refusal = reason;
    out.setFailed();
}

void TagMap::writeElement(KxMsg& out, const DcmTagKey& key, const TagElement& element, WriteContext& context)
{
    // Pictures are compressed already and stand behind the body; here is only which one it is.
    if (key == kPreview && !element.markedAsMissing() && !element.markedAsOmitted()) {
        writeKey(out, kPreviewIndex, VrCode::IS);
        writeValue(out, QByteArray::number(context.blobs.size()));
        context.blobs.append(element.value());
        return;
    }
    // Before it is appended: a message can hold no more than a little above the bound.
    if (qint64(out.position()) + element.value().size() > kMaxBodySize) {
        refuse(out, context, kTooLarge);
        return;
    }
    writeKey(out, key, storedVr(element));
    if (element.markedAsMissing() || element.markedAsOmitted())
        return;
    if (!element.isSequence()) {
        writeValue(out, element.value());
        return;
    }
    if (context.depth >= kMaxItemDepth) {
        refuse(out, context, "Tag file would nest sequence items deeper than the format allows");
        return;
    }
    const auto& sequence = static_cast<const TagSequence&>(element);
    writeLength(out, sequence.numItems());
    ++context.depth;
    for (int i = 0; i < sequence.numItems() && !out.failed(); ++i)
        sequence.itemToRead(i).serialize(out, context);
    --context.depth;
}

void TagMap::deserialize(KxMsg& in, TagMap* parent, const QList<QByteArray>& blobs)
{
    RecordContext context{blobs, kMaxElements, 0};
    deserialize(in, parent, context);
}

void TagMap::deserialize(KxMsg& in, TagMap* parent, RecordContext& context)
{
    // A node counts as well: an empty one takes two bytes of the file and many times that in memory.
    if (--context.elementsLeft < 0)
        in.setFailed();
    while (in.remaining() > 0 && !in.failed()) {
        if (--context.elementsLeft < 0) {
            in.setFailed();
            return;
        }
        quint16 group = 0;
        quint16 number = 0;
        quint8 code = 0;
        in >> group >> number >> code;
        DcmTagKey key(group, number);
        const auto vr = static_cast<VrCode>(code);
        std::unique_ptr<TagElement> element;
        if (vr == VrCode::SQ) {
            element = readSequence(in, key, parent, context);
        } else if (vr == VrCode::Missing || vr == VrCode::Omitted) {
            element = std::make_unique<TagElement>(vr, QByteArray());
        } else {
            const int length = readLength(in);
            // Also of a VR that this release does not know: all but sequences and markers have a length.
            element = std::make_unique<TagElement>(vr, in.read(length));
        }
        if (key == kPreviewIndex && element != nullptr) {
            element = previewOf(element->value(), context.blobs);
            key = kPreview;
        }
        if (element != nullptr && !in.failed())
            putInOrder(key, element.release());
    }
}

std::unique_ptr<TagElement> TagMap::readSequence(KxMsg& in, const DcmTagKey& key, const TagMap* parent,
                                                 RecordContext& context)
{
    const int count = readLength(in);
    // Every item takes at least its own length code.
    if (context.depth >= kMaxItemDepth || count < 0 || count > in.remaining() / kShortLength ||
        count > context.elementsLeft) {
        in.setFailed();
        return nullptr;
    }
    const TagElement* above = parent != nullptr ? parent->findElement(key) : nullptr;
    const auto* sequenceAbove =
        above != nullptr && above->isSequence() ? static_cast<const TagSequence*>(above) : nullptr;
    auto sequence = std::make_unique<TagSequence>();
    ++context.depth;
    for (int i = 0; i < count && !in.failed(); ++i) {
        TagMap* itemAbove =
            sequenceAbove != nullptr && i < sequenceAbove->numItems() ? sequenceAbove->item(i) : nullptr;
        auto* item = new TagMap;
        sequence->addItem(item);
        const int length = readLength(in);
        KxMsg record = in.readMessage(length);
        item->deserialize(record, itemAbove, context);
        if (record.failed())
            in.setFailed();
        // Linked as it is: what was read is already only what differs from the item above.
        item->mParent = itemAbove;
        if (itemAbove != nullptr)
            itemAbove->mChildren.append(item);
    }
    --context.depth;
    return sequence;
}

}  // namespace Kdd
