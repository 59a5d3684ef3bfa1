#include "kddlib/archive/DatasetVerifier.h"

#include "kddlib/Limits.h"
#include "kddlib/tagfile/qa/QAEditor.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"

#include <dcmtk/dcmdata/dctk.h>

namespace Kdd
{

namespace
{

using Report = std::function<void(const QByteArray&, const QByteArray&)>;

QByteArray keyText(const DcmTagKey& key)
{
    return keyName(key).toLatin1();
}

/// Group lengths are not kept, and our own group is in no DICOM file: neither can differ.
bool isKept(const DcmTagKey& key)
{
    return key.getGroup() != 0 && key.getElement() != 0 && key.getGroup() != 0x0006;
}

/// What building adds to an image: navigation data under our private creator.
bool isOurOwn(const TagMap& map, const DcmTagKey& key)
{
    constexpr Uint16 kGroup = 0x0071;
    // The element that reserves the block has no creator itself; its value is the creator's name.
    const char* creator = map.privateCreator(key);
    const TagElement* reserved = map.findElement(key);
    return key.getGroup() == kGroup && (creator != nullptr ? qstrcmp(creator, kOurPrivateCreator) == 0
                                                           : reserved->value() == kOurPrivateCreator);
}

/// The value as DCMTK gives it: text without padding, all else byte by byte.
bool valueOf(DcmElement& element, QByteArray& value)
{
    if (DcmVR(element.getVR()).isaString()) {
        char* text = nullptr;
        if (element.getString(text).bad())
            return false;
        value = QByteArray(text);
        return true;
    }
    value.resize(static_cast<int>(element.getLengthField()));
    return value.isEmpty() || element.getPartialValue(value.data(), 0, element.getLengthField()).good();
}

bool mayBeOmitted(DcmElement& element)
{
    // Encapsulated pixel data has no length of its own.
    return element.getLengthField() > kDefaultValueBound || element.ident() == EVR_PixelData;
}

class Verifier
{
public:
    explicit Verifier(const Report& report)
        : mReport(report)
    {
    }

    int faults() const { return mFaults; }

    /// Walks both sides in key order, so that what one of them lacks is
    /// noticed when the other one has passed it.
    void verify(DcmItem& item, const TagMap& map, const QByteArray& prefix)
    {
        const TagMap::iterator end = map.end();
        TagMap::iterator held = map.begin();
        for (DcmObject* object = item.nextInContainer(nullptr); object != nullptr;
             object = item.nextInContainer(object)) {
            const DcmTagKey key(object->getGTag(), object->getETag());
            if (!isKept(key))
                continue;
            for (; held != end && held.key() < key; ++held)
                onlyHeld(map, held.key(), prefix);
            if (held == end || held.key() != key) {
                fault(prefix + keyText(key), "is not in the tag file");
                continue;
            }
            object->ident() == EVR_SQ
                ? sequence(static_cast<DcmSequenceOfItems&>(*object), *held.value(), prefix)
                : element(static_cast<DcmElement&>(*object), *held.value(), prefix);
            ++held;
        }
        for (; held != end; ++held)
            onlyHeld(map, held.key(), prefix);
    }

private:
    void fault(const QByteArray& path, const QByteArray& text)
    {
        ++mFaults;
        mReport(path, text);
    }

    void onlyHeld(const TagMap& map, const DcmTagKey& key, const QByteArray& prefix)
    {
        if (isKept(key) && !isOurOwn(map, key))
            fault(prefix + keyText(key), "is not in the DICOM file");
    }

    void sequence(DcmSequenceOfItems& sequence, const TagElement& held, const QByteArray& prefix)
    {
        const QByteArray path = prefix + keyText(sequence.getTag());
        if (held.markedAsOmitted()) {
            // Only what is longer than the bound may have been left out, so the marker alone proves nothing.
            if (sequence.getLength(EXS_LittleEndianImplicit, EET_UndefinedLength) <= kDefaultValueBound)
                fault(path, "is left out of the tag file");
            return;
        }
        const auto* items = held.isSequence() ? static_cast<const TagSequence*>(&held) : nullptr;
        if (items == nullptr || static_cast<unsigned long>(items->numItems()) != sequence.card()) {
            fault(path, "has other items in the tag file");
            return;
        }
        int i = 0;
        for (DcmObject* item = sequence.nextInContainer(nullptr); item != nullptr;
             item = sequence.nextInContainer(item), ++i)
            verify(static_cast<DcmItem&>(*item), items->itemToRead(i),
                   path + '[' + QByteArray::number(i) + "].");
    }

    void element(DcmElement& element, const TagElement& held, const QByteArray& prefix)
    {
        const QByteArray path = prefix + keyText(element.getTag());
        QByteArray value;
        if (held.markedAsOmitted()) {
            if (!mayBeOmitted(element))
                fault(path, "is left out of the tag file");
        } else if (held.vr() != vrCodeOf(element.getVR())) {
            fault(path, QByteArray("has VR ") + DcmVR(element.getVR()).getVRName() + ", in the tag file " +
                            vrName(held.vr()));
        } else if (!valueOf(element, value)) {
            fault(path, "cannot be read from the DICOM file");
        } else if (value != held.value()) {
            fault(path, "has " + QByteArray::number(value.size()) + " bytes [" + shown(held, value) +
                            "], in the tag file " + QByteArray::number(held.value().size()) + " bytes [" +
                            shown(held, held.value()) + ']');
        }
    }

    /// Both sides by the VR of the tag file, so that they can be compared by eye.
    static QByteArray shown(const TagElement& held, const QByteArray& value)
    {
        QByteArray text;
        TagElement(held.vr(), value).getValueAsString(text);
        return text.left(60);
    }

    const Report& mReport;
    int mFaults = 0;
};

}  // namespace

int verifyDataset(DcmItem& dataset, const TagMap& image, const Report& report)
{
    Verifier verifier(report);
    verifier.verify(dataset, image, QByteArray());
    return verifier.faults();
}

int verifyCorrected(const TagMap& expected, const TagMap& image, const Report& report)
{
    int faults = 0;
    const auto tell = [&](const DcmTagKey& key, const char* fault) {
        ++faults;
        report(keyText(key), fault);
    };
    const auto onlyHeld = [&](const DcmTagKey& key) {
        // What building adds are a place in a picture and the block that it stands in.
        if (isKept(key) && !isOurOwn(image, key))
            tell(key, "is neither in the DICOM file nor in a correction");
    };
    const TagMap::iterator end = image.end();
    TagMap::iterator held = image.begin();
    for (TagMap::iterator it = expected.begin(); it != expected.end(); ++it) {
        if (!isKept(it.key()))
            continue;
        // As for a dataset: what the image alone has is found on the way to the next key that is expected.
        for (; held != end && held.key() < it.key(); ++held)
            onlyHeld(held.key());
        if (held == end || held.key() != it.key()) {
            tell(it.key(), "is not in the tag file");
            continue;
        }
        if (!it.value()->compare(*held.value(), true, nullptr))
            tell(it.key(), "is not what the DICOM file and its corrections say");
        ++held;
    }
    for (; held != end; ++held)
        onlyHeld(held.key());
    return faults;
}

}  // namespace Kdd
