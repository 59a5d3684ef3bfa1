#include "kddlib/tagfile/qa/ImageOverlay.h"

#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "platform/base/KxMsg.h"

#include <dcmtk/dcmdata/dcdeftag.h>

namespace Kdd
{

namespace
{

constexpr quint8 kForm = 1;
constexpr Uint16 kFirstBlock = 0x10;
constexpr Uint16 kLastBlock = 0xff;

bool isPrivate(const DcmTagKey& key)
{
    return (key.getGroup() & 1) != 0;
}

/// Whether the key reserves a block for a creator.
bool isCreator(const DcmTagKey& key)
{
    return isPrivate(key) && key.getElement() >= kFirstBlock && key.getElement() <= kLastBlock;
}

DcmTagKey creatorOf(const DcmTagKey& key)
{
    return {key.getGroup(), static_cast<Uint16>(key.getElement() >> 8)};
}

}  // namespace

ImageOverlay::ImageOverlay()
    : mElements(std::make_unique<TagMap>())
{
}

ImageOverlay::~ImageOverlay() = default;
ImageOverlay::ImageOverlay(ImageOverlay&&) noexcept = default;
ImageOverlay& ImageOverlay::operator=(ImageOverlay&&) noexcept = default;

void ImageOverlay::note(const TagMap& image, const DcmTagKey& key)
{
    // Without its creator a private value means nothing, and could not be put into another image's block.
    if (isPrivate(key) && !isCreator(key) && image.findElement(creatorOf(key)) != nullptr)
        note(image, creatorOf(key));
    const TagElement* shown = image.findElement(key);
    if (shown == nullptr)
        mElements->markAsMissing(key);
    else
        mElements->putElement(key, shown->clone());
}

void ImageOverlay::noteLogged(const TagMap& image)
{
    AuditLog log;
    QVector<AuditEntry> entries;
    if (!log.read(image) || !log.decode(entries) || entries.isEmpty())
        return;
    for (const AuditEntry& entry : qAsConst(entries)) {
        for (const AuditChange& change : entry.changes) {
            if (change.key != DCM_PixelData)
                note(image, change.key);
        }
    }
    for (const DcmTagKey& key : AuditLog::keysIn(image))
        note(image, key);
}

/// Whether the private block of the key belongs to the same creator in the image, or to none.
bool ImageOverlay::fits(const TagMap& image, const DcmTagKey& key) const
{
    const TagElement* ours = mElements->findElement(isCreator(key) ? key : creatorOf(key));
    const TagElement* theirs = image.findElement(isCreator(key) ? key : creatorOf(key));
    return ours == nullptr || theirs == nullptr || ours->value() == theirs->value();
}

void ImageOverlay::applyTo(TagMap& image) const
{
    const TagMap::Tags& elements = mElements->tagsForLevel();
    // Creators come before what stands in their blocks, and a block that is not free stays whose it is.
    for (auto it = elements.cbegin(); it != elements.cend(); ++it) {
        const DcmTagKey& key = it.key();
        const TagElement& element = *it.value();
        const bool isInPlace = !isPrivate(key) || fits(image, key);
        if (isInPlace && element.markedAsMissing()) {
            image.deleteElement(key);
        } else if (isInPlace) {
            image.putElement(key, element.clone());
        } else if (!isCreator(key) && !element.markedAsMissing()) {
            // Never null: a block that does not fit has a creator on both sides.
            const TagElement* creator = mElements->findElement(creatorOf(key));
            image.putAndInsertValue(key, creator->value().constData(), element.vr(), element.value());
        }
    }
}

AuditLog ImageOverlay::log() const
{
    AuditLog log;
    log.read(*mElements);
    return log;
}

bool ImageOverlay::isEmpty() const
{
    return mElements->tagsForLevel().isEmpty();
}

QByteArray ImageOverlay::seriesOf(const TagMap& image) const
{
    return mElements->findElement(DCM_SeriesInstanceUID) != nullptr ? image.uid(TagMap::SeriesLevel)
                                                                    : QByteArray();
}

QByteArray ImageOverlay::encode() const
{
    KxMsg out;
    // A preview would go to a table that the overlay does not have; none is ever noted.
    QList<QByteArray> previews;
    out << kForm;
    mElements->serialize(out, previews);
    return out.bytes();
}

bool ImageOverlay::decode(const QByteArray& bytes)
{
    KxMsg in(bytes);
    quint8 form = 0;
    in >> form;
    const int length = TagMap::readLength(in);
    // Bytes behind the record were never written, so they are damage as well.
    if (in.failed() || form != kForm || length != in.remaining())
        return false;
    KxMsg record = in.readMessage(length);
    auto elements = std::make_unique<TagMap>();
    elements->deserialize(record, nullptr, {});
    if (record.failed())
        return false;
    mElements = std::move(elements);
    return true;
}

}  // namespace Kdd
