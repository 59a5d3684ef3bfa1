#include "server/dicomweb/retrieve/BulkValue.h"

#include "server/dicomweb/MediaTypes.h"

#include <QCryptographicHash>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <kddlib/Limits.h>
#include <kddlib/LogFile.h>
#include <kddlib/ObjectAddress.h>
#include <kddlib/TagMap.h>
#include <kddlib/TagSequence.h>

namespace Kdd::DicomWeb
{

namespace
{

bool readKey(const QByteArray& text, DcmTagKey& key)
{
    bool isNumber = false;
    const uint number = text.toUInt(&isNumber, 16);
    key = DcmTagKey(static_cast<Uint16>(number >> 16U), static_cast<Uint16>(number & 0xffffU));
    return isNumber && text.size() == 8 && text.at(0) != '+';
}

bool readItem(const QByteArray& text, int& item)
{
    bool isNumber = false;
    item = text.toInt(&isNumber);
    return isNumber && text.at(0) >= '0' && text.at(0) <= '9';
}

const TagElement* follow(const TagMap& image, const QVector<ElementStep>& steps)
{
    const TagMap* map = &image;
    for (int i = 0;; ++i) {
        const ElementStep& step = steps.at(i);
        const TagElement* element = step.key.getGroup() == 0x0006 ? nullptr : map->findElement(step.key);
        // What was left out as a whole, sequences too, is looked for in the file.
        if (element == nullptr || element->markedAsOmitted() || i + 1 == steps.size())
            return element;
        if (!element->isSequence())
            return nullptr;
        const auto& items = static_cast<const TagSequence&>(*element);
        if (step.item >= items.numItems() || items.item(step.item) == nullptr)
            return nullptr;
        map = items.item(step.item);
    }
}

/// Documents are named as what they are, so that browsers show them, when that is nothing a browser would run.
QByteArray documentTypeOf(const TagMap& image, const QVector<ElementStep>& steps)
{
    QByteArray type;
    if (steps.size() == 1 && steps.first().key == DCM_EncapsulatedDocument)
        image.findAndGetString(DCM_MIMETypeOfEncapsulatedDocument, type);
    for (const char* known : {"application/pdf", "model/stl", "model/obj", "model/mtl"}) {
        if (type.toLower() == known)
            return known;
    }
    return kOctetStream;
}

void addOmitted(const TagMap& map, QVector<ElementStep>& way, QVector<QVector<ElementStep>>& found)
{
    const TagMap::iterator end = map.end();
    for (TagMap::iterator it = map.begin(); it != end; ++it) {
        if (it.key().getGroup() == 0x0006)
            continue;
        way.append({it.key(), 0});
        if (it.value()->markedAsOmitted())
            found.append(way);
        const auto* items = it.value()->isSequence() ? static_cast<const TagSequence*>(it.value()) : nullptr;
        for (int i = 0; items != nullptr && i < items->numItems(); ++i) {
            way.last().item = i;
            addOmitted(items->itemToRead(i), way, found);
        }
        way.removeLast();
    }
}

}  // namespace

QByteArray etagOf(const QByteArray& state, const QByteArray& name)
{
    const QByteArray hash = QCryptographicHash::hash(state + '\n' + name, QCryptographicHash::Sha256).toHex();
    return '"' + hash.left(32) + '"';
}

qint64 BulkValue::length() const
{
    qint64 sum = 0;
    for (const FileStretch& stretch : stretches)
        sum += stretch.length;
    return sum;
}

void BulkValue::append(qint64 offset, qint64 length, std::vector<Http::BodyPart>& body) const
{
    QVector<FileStretch> cut;
    for (const FileStretch& stretch : stretches) {
        const qint64 skipped = qMin(offset, stretch.length);
        const qint64 taken = qMin(length, stretch.length - skipped);
        cut.append({stretch.offset + skipped, taken});
        offset -= skipped;
        length -= taken;
    }
    source->append(cut, body);
}

bool readSteps(const QVector<QByteArray>& segments, QVector<ElementStep>& steps)
{
    // Keys and items by turns, a key at both ends.
    if (segments.size() % 2 == 0 || segments.size() > 2 * kMaxItemDepth + 1)
        return false;
    for (int i = 0; i < segments.size(); i += 2) {
        ElementStep step;
        if (!readKey(segments.at(i), step.key) ||
            (i + 1 < segments.size() && !readItem(segments.at(i + 1), step.item)))
            return false;
        steps.append(step);
    }
    return true;
}

QByteArray textOf(const QVector<ElementStep>& steps)
{
    QByteArray text;
    for (int i = 0; i < steps.size(); ++i) {
        const ElementStep& step = steps.at(i);
        text += QString::asprintf("%04X%04X", unsigned(step.key.getGroup()), unsigned(step.key.getElement()))
                    .toLatin1();
        if (i + 1 < steps.size())
            text += '/' + QByteArray::number(step.item) + '/';
    }
    return text;
}

bool leadToPixels(const QVector<ElementStep>& steps)
{
    const DcmTagKey& key = steps.first().key;
    return steps.size() == 1 &&
           (key == DCM_PixelData || key == DCM_FloatPixelData || key == DCM_DoubleFloatPixelData);
}

Verdict findBulkValue(const ServedStudy& study, const ListedImage& image, const QVector<ElementStep>& steps,
                      ObjectShelf& objects, BulkValue& value)
{
    ImageOrigin origin;
    bool isInFile = false;
    const Verdict held = study.look([&](const TagFile& file) -> Verdict {
        const TagMap* map = file.findImage(image.key);
        const TagElement* element = map == nullptr ? nullptr : follow(*map, steps);
        if (element == nullptr || element->isSequence())
            return {404, QStringLiteral("The instance has no such value")};
        value.mediaType = documentTypeOf(*map, steps);
        isInFile = element->markedAsOmitted();
        if (isInFile)
            return ImageOrigin::of(*map, origin).good()
                       ? Verdict()
                       : Verdict{500, QStringLiteral("It is not known where the instance's DICOM file is")};
        value.source = std::make_shared<MemoryObject>(element->value(), study.version());
        value.stretches = {{0, element->value().size()}};
        value.etag = etagOf(study.version() + '\n' + image.key, textOf(steps));
        return {};
    });
    if (held.bad() || !isInFile)
        return held;
    FoundObject object;
    const Verdict opened = objects.open(origin, object);
    if (opened.bad())
        return opened;
    FileStretch stretch;
    if (!object.index.findValue(*object.bytes, steps, stretch)) {
        LogFile::errorf("%s does not have %s, which the tag file left out",
                        shownAddress(origin.path).constData(), textOf(steps).constData());
        return {500, QStringLiteral("The instance's DICOM file does not have the value")};
    }
    value.source = object.bytes;
    value.stretches = {stretch};
    if (!object.identity.isEmpty())
        value.etag = etagOf(origin.path + '\n' + object.identity, textOf(steps));
    return {};
}

QVector<QVector<ElementStep>> omittedValues(const ServedStudy& study, const ListedImage& image)
{
    QVector<QVector<ElementStep>> found;
    study.look([&](const TagFile& file) {
        QVector<ElementStep> way;
        const TagMap* map = file.findImage(image.key);
        if (map != nullptr)
            addOmitted(*map, way, found);
    });
    return found;
}

}  // namespace Kdd::DicomWeb
