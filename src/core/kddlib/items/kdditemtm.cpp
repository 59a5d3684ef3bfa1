#include "kddlib/items/kdditemtm.h"

#include "kddlib/net/dicom/KxDcmFileLoader.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"
#include "platform/base/LogFile.h"

#include <QtEndian>

#include <dcmtk/dcmdata/dcfilefo.h>
#include <dcmtk/dcmdata/dcsequen.h>

#include <algorithm>
#include <utility>

namespace Kdd
{

namespace
{

constexpr int kFirstEncapsulated = EXS_JPEGProcess1;
constexpr int kLastSyntax = EXS_PrivateGE_LEI_WithBigEndianPixelData;

makeOFConditionConst(EC_IndexOutOfRange, 1000, 1, OF_error, "index out of range");

/// The number under which the dataset's transfer syntax is stored; -1 when it is not.
int transferSyntaxNumber(const TagMap& map)
{
    const TagElement* element = map.findElement(kTransferSyntax);
    if (element == nullptr || element->vr() != VrCode::OB || element->value().size() != 1)
        return -1;
    return static_cast<unsigned char>(element->value().at(0));
}

/// The one place where an image's file is opened.
std::shared_ptr<DcmDataset> loadDataset(const QByteArray& path, OFCondition& condition)
{
    DcmFileFormat file;
    condition = loadDicomFile(path.constData(), file);
    return std::shared_ptr<DcmDataset>(condition.good() ? file.getAndRemoveDataset() : nullptr);
}

bool isListOfBytes(VrCode vr)
{
    return vr == VrCode::OB || vr == VrCode::OW || vr == VrCode::Ox || vr == VrCode::Lt || vr == VrCode::UN;
}

/// For DCMTK's own reading of a value as text: only that drops the padding of every value, knows where a backslash is a
/// character like any other and writes floats with all their digits. Null when the text form is as good or, being
/// shortened, better.
std::unique_ptr<DcmElement> elementForText(const TagElement& element, const DcmTagKey& key)
{
    const bool isPlainText =
        isTextVr(element.vr()) && !element.value().contains(' ') && !element.value().contains('\\');
    if (isPlainText || isListOfBytes(element.vr()))
        return nullptr;
    return element.newDcmElement(element.tagFor(key));
}

OFString textForm(const TagElement& element)
{
    QByteArray text;
    element.getValueAsString(text);
    return {text.constData(), static_cast<std::size_t>(text.size())};
}

template <typename T>
OFCondition arrayOf(const TagMap& map, const DcmTagKey& key, const T*& values, unsigned long* count)
{
    values = nullptr;
    const TagElement* element = map.findElement(key);
    if (element == nullptr)
        return EC_TagNotFound;
    values = reinterpret_cast<const T*>(element->value().constData());
    if (count != nullptr)
        *count = static_cast<unsigned long>(element->value().size()) / sizeof(T);
    return EC_Normal;
}

/// A new element of a text; null when the value representation has no conversion from text.
std::unique_ptr<TagElement> newElement(VrCode vr, const QByteArray& text)
{
    auto element = std::make_unique<TagElement>(vr, QByteArray());
    if (!element->putValueAsString(text))
        element.reset();
    return element;
}

/// US where the dictionary leaves the sign open: texts are converted to numbers that have one or have none.
VrCode dictionaryVr(const DcmTagKey& key)
{
    const DcmEVR evr = DcmTag(key).getEVR();
    return vrCodeOf(evr == EVR_xs ? EVR_US : evr);
}

}  // namespace

ItemTM::ItemTM(TagMap& map)
    : mMap(&map)
{
}

ItemTM::ItemTM(TagMap& map, std::shared_ptr<TagMap> mapOwner)
    : mMap(&map)
    , mMapOwner(std::move(mapOwner))
{
}

std::shared_ptr<DcmDataset> ItemTM::obtainDcmDataset()
{
    if (mDataset != nullptr)
        return mDataset;
    QByteArray path;
    if (!mMap->findAndGetString(kFilePath, path)) {
        LogFile::errorf("KDD_DicomFilePath undefined, cannot load DICOM file");
        return nullptr;
    }
    if (path.isEmpty())
        return nullptr;
    OFCondition condition;
    mDataset = loadDataset(path, condition);
    if (condition.bad()) {
        LogFile::errorf("Could not load %s: %s", path.constData(), condition.text());
        // A viewer asks for every image of a series again and again: one line is enough.
        mMap->putAndInsertValue(kFilePath, VrCode::LO, QByteArray());
    }
    return mDataset;
}

bool ItemTM::isEncapsulated()
{
    return transferSyntaxNumber(*mMap) >= kFirstEncapsulated;
}

E_TransferSyntax ItemTM::transferSyntax()
{
    // Of a dataset made in memory the byte may be 255, which is no number of a syntax.
    const int number = transferSyntaxNumber(*mMap);
    return number <= kLastSyntax ? static_cast<E_TransferSyntax>(number) : EXS_Unknown;
}

bool ItemTM::tagExists(const DcmTagKey& key, DcmEVR& vr)
{
    const TagElement* element = mMap->findElement(key);
    if (element != nullptr)
        vr = element->tagFor(key).getEVR();
    return element != nullptr;
}

bool ItemTM::tagExists(const DcmTagKey& key)
{
    return mMap->findElement(key) != nullptr;
}

OFCondition ItemTM::findAndGetOFString(const DcmTagKey& key, OFString& value)
{
    value.clear();
    const TagElement* element = mMap->findElement(key);
    if (element == nullptr)
        return EC_TagNotFound;
    const std::unique_ptr<DcmElement> copy = elementForText(*element, key);
    if (copy == nullptr || copy->getOFString(value, 0).bad()) {
        value = textForm(*element);
        // Without a backslash the position is larger than any text.
        value.resize(std::min(value.find('\\'), value.size()));
    }
    return EC_Normal;
}

OFCondition ItemTM::findAndGetOFStringArray(const DcmTagKey& key, OFString& value)
{
    value.clear();
    const TagElement* element = mMap->findElement(key);
    if (element == nullptr)
        return EC_TagNotFound;
    const std::unique_ptr<DcmElement> copy = elementForText(*element, key);
    if (copy == nullptr || copy->getOFStringArray(value).bad())
        value = textForm(*element);
    return EC_Normal;
}

OFCondition ItemTM::findAndGetLongInt(const DcmTagKey& key, long& value)
{
    value = 0;
    const TagElement* element = mMap->findElement(key);
    if (element == nullptr)
        return EC_TagNotFound;
    bool ok = false;
    const int number = element->valueAsInt(&ok, 0);
    // A large unsigned number is no negative one.
    value = element->vr() == VrCode::UL ? static_cast<long>(static_cast<quint32>(number)) : number;
    return ok ? EC_Normal : EC_ValueRepresentationViolated;
}

OFCondition ItemTM::findAndGetUint16(const DcmTagKey& key, Uint16& value)
{
    value = 0;
    const TagElement* element = mMap->findElement(key);
    if (element == nullptr)
        return EC_TagNotFound;
    if (element->value().size() < 2)
        return EC_ValueRepresentationViolated;
    // By its bits: a signed value comes out as it does from a dataset.
    value = qFromLittleEndian<quint16>(element->value().constData());
    return EC_Normal;
}

OFCondition ItemTM::findAndGetSint16Array(const DcmTagKey& key, const Sint16*& values, unsigned long* count)
{
    return arrayOf(*mMap, key, values, count);
}

OFCondition ItemTM::findAndGetUint16Array(const DcmTagKey& key, const Uint16*& values, unsigned long* count)
{
    return arrayOf(*mMap, key, values, count);
}

OFCondition ItemTM::findAndGetUint8Array(const DcmTagKey& key, const Uint8*& values, unsigned long* count)
{
    return arrayOf(*mMap, key, values, count);
}

OFCondition ItemTM::findAndGetFloat32Array(const DcmTagKey& key, const Float32*& values, unsigned long* count)
{
    return arrayOf(*mMap, key, values, count);
}

OFCondition ItemTM::findAndGetSequence(const DcmTagKey& key, SequenceOfItems*& sequence)
{
    sequence = nullptr;
    TagElement* element = mMap->findElement(key);
    if (element == nullptr)
        return EC_TagNotFound;
    if (!element->isSequence())
        return EC_InvalidVR;
    auto* found = static_cast<TagSequence*>(element);
    // As for a dataset: asked for a second time, the same object is handed out.
    auto at = std::find_if(mSequences.begin(), mSequences.end(),
                           [found](const auto& held) { return held->tagSequence() == found; });
    if (at == mSequences.end())
        at = mSequences.insert(at, std::make_shared<SequenceOfItemsTM>(key, found));
    sequence = at->get();
    return EC_Normal;
}

OFCondition ItemTM::findAndGetSequenceItem(const DcmTagKey& key, Item*& item, int index)
{
    return findItem(key, item, index, EC_IndexOutOfRange);
}

OFCondition ItemTM::putAndInsertStringArray(const DcmTagKey& key, const char* value)
{
    const QByteArray text(value);
    TagElement* held = mMap->findElement(key);
    if (held != nullptr && !held->markedAsOmitted()) {
        held->putValueAsString(text);
        return EC_Normal;
    }
    std::unique_ptr<TagElement> element = newElement(dictionaryVr(key), text);
    if (element == nullptr)
        element = newElement(VrCode::LO, text);
    mMap->putElement(key, element.release());
    return EC_Normal;
}

unsigned int SequenceOfItemsTM::card()
{
    return static_cast<unsigned int>(mSequence->numItems());
}

Item* SequenceOfItemsTM::getItem(unsigned int index)
{
    if (index >= card() || mSequence->item(static_cast<int>(index)) == nullptr)
        return nullptr;
    if (mItems.size() <= index)
        mItems.resize(index + 1U);
    // Made when it is first asked for, and kept: callers are promised the same pointer.
    std::shared_ptr<ItemTM>& item = mItems[index];
    if (item == nullptr)
        item = std::make_shared<ItemTM>(*mSequence->item(static_cast<int>(index)));
    return item.get();
}

DcmSequenceOfItems* SequenceOfItemsTM::createDcmSequenceOfItems()
{
    return static_cast<DcmSequenceOfItems*>(mSequence->createDcmElement(mKey));
}

}  // namespace Kdd
