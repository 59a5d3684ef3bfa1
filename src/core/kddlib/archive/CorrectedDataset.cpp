#include "kddlib/archive/CorrectedDataset.h"

#include "kddlib/Limits.h"
#include "kddlib/archive/PixelDescription.h"
#include "kddlib/net/dicom/DicomFileReader.h"
#include "kddlib/tagfile/qa/ImageIdentity.h"
#include "kddlib/tagfile/qa/QAEditor.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"
#include "platform/volume/KxCompressedDataMedia.h"

#include <QtEndian>

#include <dcmtk/dcmdata/dcostrmb.h>
#include <dcmtk/dcmdata/dctk.h>
#include <dcmtk/dcmdata/dcwcache.h>

#include <algorithm>
#include <iterator>
#include <memory>
#include <vector>

namespace Kdd
{

namespace
{

constexpr Uint16 kOwnGroup = 0x0006;

/// Of what is not pixels, which has to be in memory to be changed [bytes].
constexpr qint64 kMaxHeader = qint64(512) * 1024 * 1024;

Result readInto(MediaSource& file, qint64 offset, qint64 end, QByteArray& bytes)
{
    const int start = bytes.size();
    bytes.resize(start + static_cast<int>(end - offset));
    for (qint64 done = start; done < bytes.size();) {
        const qint64 got = file.read(offset + done - start, bytes.data() + done, bytes.size() - done);
        if (got <= 0)
            return Result::failure(QStringLiteral("The file ends early or cannot be read"));
        done += got;
    }
    return {};
}

Result readWithoutPixels(MediaSource& file, const FileStretch& pixels, DcmFileFormat& dicom)
{
    if (file.size() - pixels.length > kMaxHeader)
        return Result::failure(QStringLiteral("The file has more attributes than can be held"));
    QByteArray bytes;
    Result result = readInto(file, 0, pixels.offset, bytes);
    if (result.good())
        result = readInto(file, pixels.end(), file.size(), bytes);
    if (result.bad())
        return result;
    const OFCondition condition = readDicomBuffer(bytes, dicom);
    return condition.good() ? Result()
                            : Result::failure(QStringLiteral("The DICOM file cannot be read: ") +
                                              QString::fromLatin1(condition.text()));
}

bool isPixels(const DcmTagKey& key)
{
    return key == DCM_PixelData || key == DCM_FloatPixelData || key == DCM_DoubleFloatPixelData;
}

bool isPassedOver(const DcmTagKey& key)
{
    return key.getGroup() == kOwnGroup || isPixels(key);
}

bool holdsOmitted(const TagMap& map)
{
    const TagMap::iterator end = map.end();
    for (TagMap::iterator it = map.begin(); it != end; ++it) {
        if (it.value()->markedAsOmitted())
            return true;
        const auto* items = it.value()->isSequence() ? static_cast<const TagSequence*>(it.value()) : nullptr;
        for (int i = 0; items != nullptr && i < items->numItems(); ++i) {
            if (holdsOmitted(items->itemToRead(i)))
                return true;
        }
    }
    return false;
}

/// Makes a dataset show what a tag file shows, in place; what is equal stays as it is, byte by byte.
class Correction
{
public:
    bool hasChanged() const { return mHasChanged; }

    Result apply(DcmItem& item, const TagMap& file, const TagMap& shown)
    {
        const TagMap::iterator fileEnd = file.end();
        const TagMap::iterator shownEnd = shown.end();
        TagMap::iterator held = file.begin();
        Result result;
        for (TagMap::iterator it = shown.begin(); it != shownEnd && result.good(); ++it) {
            for (; held != fileEnd && held.key() < it.key(); ++held)
                remove(item, held.key());
            const bool isInFile = held != fileEnd && held.key() == it.key();
            if (!isPassedOver(it.key()))
                result = show(item, it.key(), isInFile ? held.value() : nullptr, *it.value());
            if (isInFile)
                ++held;
        }
        for (; held != fileEnd && result.good(); ++held)
            remove(item, held.key());
        return result;
    }

private:
    void remove(DcmItem& item, const DcmTagKey& key)
    {
        if (isPassedOver(key))
            return;
        item.findAndDeleteElement(key);
        mHasChanged = true;
    }

    Result show(DcmItem& item, const DcmTagKey& key, const TagElement* held, const TagElement& shown)
    {
        if (shown.markedAsOmitted())
            return held != nullptr ? Result() : missing(key);
        if (held != nullptr && held->compare(shown, true, nullptr))
            return {};
        mHasChanged = true;
        if (shown.isSequence())
            return showItems(item, key, held, static_cast<const TagSequence&>(shown));
        return replace(item, key, shown);
    }

    static Result missing(const DcmTagKey& key)
    {
        return Result::failure(
            QStringLiteral("The file does not have the value of %1, so it is not the one the "
                           "tag file was made from")
                .arg(keyName(key)));
    }

    static Result replace(DcmItem& item, const DcmTagKey& key, const TagElement& shown)
    {
        std::unique_ptr<DcmElement> element(shown.createDcmElement(key));
        if (element == nullptr || item.insert(element.get(), OFTrue).bad())
            return Result::failure(QStringLiteral("The value of %1 cannot be written").arg(keyName(key)));
        static_cast<void>(element.release());
        return {};
    }

    Result showItems(DcmItem& item, const DcmTagKey& key, const TagElement* held, const TagSequence& shown)
    {
        DcmSequenceOfItems* items = nullptr;
        const auto* own =
            held != nullptr && held->isSequence() ? static_cast<const TagSequence*>(held) : nullptr;
        const bool isSame = own != nullptr && own->numItems() == shown.numItems() &&
                            item.findAndGetSequence(key, items).good() &&
                            items->card() == static_cast<unsigned long>(own->numItems());
        if (!isSame) {
            for (int i = 0; i < shown.numItems(); ++i) {
                if (holdsOmitted(shown.itemToRead(i)))
                    return missing(key);
            }
            return replace(item, key, shown);
        }
        Result result;
        int i = 0;
        for (DcmObject* next = items->nextInContainer(nullptr); next != nullptr && result.good();
             next = items->nextInContainer(next), ++i)
            result = apply(static_cast<DcmItem&>(*next), own->itemToRead(i), shown.itemToRead(i));
        return result;
    }

    bool mHasChanged = false;
};

using Pixels = CorrectedDataset::Pixels;

/// The length of an element that ends with a delimiter, beyond what any other can have.
constexpr qint64 kUndefinedLength = 0xffffffff;

Pixels pixelsFor(const FrameIndex& index, const QByteArray& syntaxUID)
{
    if (!index.hasPixels())
        return Pixels::None;
    if (syntaxUID == index.transferSyntaxUID())
        return Pixels::Stored;
    if (index.encodings().contains(syntaxUID))
        return Pixels::Encoded;
    return index.isEncapsulated() ? Pixels::Decoded : Pixels::Stored;
}

qint64 lengthOf(const FrameIndex& index, Pixels pixels)
{
    switch (pixels) {
    case Pixels::None:
        return 0;
    case Pixels::Stored:
        return index.pixelValue().length;
    case Pixels::Decoded:
        return DecodedPixels::lengthOf(index);
    case Pixels::Encoded:
        break;
    }
    return -1;
}

/// Whether the length of an element of this VR has four bytes, as that of pixels is written.
bool hasLongLength(const QByteArray& vr)
{
    static const char* const kVrs[] = {"OB", "OD", "OF", "OL", "OV", "OW", "SQ",
                                       "SV", "UC", "UN", "UR", "UT", "UV"};
    return std::any_of(std::begin(kVrs), std::end(kVrs), [&](const char* each) { return vr == each; });
}

QByteArray vrOf(const FrameIndex& index, Pixels pixels, DcmDataset& dataset)
{
    Uint16 bits = 0;
    // What else a file has there are bytes all the same.
    if (pixels == Pixels::Stored)
        return hasLongLength(index.pixelVr()) ? index.pixelVr() : QByteArray("OW");
    dataset.findAndGetUint16(DCM_BitsAllocated, bits);
    return pixels == Pixels::Decoded && bits > 8 ? "OW" : "OB";
}

template <typename Object, typename... Arguments>
Result written(Object& object, QByteArray& bytes, E_TransferSyntax syntax, Arguments... arguments)
{
    constexpr int kBlock = 64 * 1024;
    std::vector<char> block(kBlock);
    DcmOutputBufferStream out(block.data(), kBlock);
    DcmWriteCache cache;
    OFCondition condition;
    object.transferInit();
    do {
        condition = object.write(out, syntax, EET_UndefinedLength, &cache, arguments...);
        void* from = nullptr;
        offile_off_t length = 0;
        out.flushBuffer(from, length);
        bytes.append(static_cast<const char*>(from), static_cast<int>(length));
    } while (condition == EC_StreamNotifyClient && bytes.size() <= kMaxHeader);
    object.transferEnd();
    return condition.good() ? Result()
                            : Result::failure(QStringLiteral("The dataset cannot be written: ") +
                                              QString::fromLatin1(condition.text()));
}

/// The elements behind the pixels, taken out of the dataset.
std::unique_ptr<DcmDataset> takeTail(DcmDataset& dataset)
{
    auto tail = std::make_unique<DcmDataset>();
    std::vector<DcmElement*> behind;
    for (unsigned long i = dataset.card(); i > 0 && DCM_PixelData < dataset.getElement(i - 1)->getTag(); --i)
        behind.push_back(dataset.getElement(i - 1));
    for (DcmElement* element : behind) {
        dataset.remove(element);
        tail->insert(element);
    }
    return tail;
}

OFCondition putUid(DcmMetaInfo& meta, const DcmTagKey& key, const QByteArray& uid)
{
    return uid.isEmpty() ? EC_Normal : meta.putAndInsertString(key, uid.constData());
}

Result writeMeta(DcmFileFormat& dicom, const TagMap& image, const QByteArray& syntaxUID, QByteArray& bytes)
{
    DcmMetaInfo& meta = *dicom.getMetaInfo();
    QByteArray sopClass;
    image.findAndGetString(DCM_SOPClassUID, sopClass);
    // What is missing in it comes first. DCMTK does not follow the dataset's UIDs in every file, and the syntax may be
    // one that it has no name for.
    OFCondition condition = dicom.validateMetaInfo(EXS_LittleEndianExplicit, EWM_updateMeta);
    if (condition.good())
        condition = putUid(meta, DCM_MediaStorageSOPClassUID, sopClass);
    if (condition.good())
        condition = putUid(meta, DCM_MediaStorageSOPInstanceUID, image.uid(TagMap::ImageLevel));
    if (condition.good())
        condition = putUid(meta, DCM_TransferSyntaxUID, syntaxUID);
    if (condition.good())
        condition = meta.computeGroupLengthAndPadding(EGL_recalcGL, EPD_noChange, EXS_LittleEndianExplicit,
                                                      EET_UndefinedLength);
    return condition.good() ? written(meta, bytes, EXS_LittleEndianExplicit)
                            : Result::failure(QStringLiteral("The meta header cannot be written: ") +
                                              QString::fromLatin1(condition.text()));
}

/// The tag, VR and length of the element with the pixels.
QByteArray pixelHead(const FrameIndex& index, bool isExplicit, const QByteArray& vr, qint64 length)
{
    QByteArray head(isExplicit ? 12 : 8, 0);
    qToLittleEndian<quint16>(index.pixelKey().getGroup(), head.data());
    qToLittleEndian<quint16>(index.pixelKey().getElement(), head.data() + 2);
    if (isExplicit)
        head.replace(4, 2, vr);
    qToLittleEndian<quint32>(static_cast<quint32>(length), head.data() + head.size() - 4);
    return head;
}

}  // namespace

Result ImageOrigin::of(const TagMap& image, ImageOrigin& origin)
{
    AuditLog log;
    QVector<AuditEntry> entries;
    const QByteArray path = filePathOf(image);
    if (path.isEmpty())
        return Result::failure(QStringLiteral("The image has no file"));
    if (!log.read(image) || !log.decode(entries))
        return Result::failure(QStringLiteral("The image's audit log is damaged"));
    const ImageIdentity before = identityBefore(log, identityOf(image, path), path);
    origin = {path, before.studyUID, before.image == path ? QByteArray() : before.image};
    return {};
}

Result CorrectedDataset::make(MediaSource& file, const FrameIndex& index, const TagMap& image,
                              const QByteArray& syntaxUID)
{
    const bool isStored = syntaxUID == index.transferSyntaxUID();
    const bool isExplicit = syntaxUID != "1.2.840.10008.1.2";
    DcmFileFormat dicom;
    Result result = readWithoutPixels(file, index.pixelElement(), dicom);
    if (result.bad())
        return result;
    DcmDataset& dataset = *dicom.getDataset();
    const std::unique_ptr<TagMap> held(TagMap::createTagMap(&dataset, kDefaultValueBound));
    Correction correction;
    result = correction.apply(dataset, *held, image);
    if (result.bad())
        return result;

    CorrectedDataset made;
    made.mIsAsInFile = isStored && !correction.hasChanged();
    made.mPixels = pixelsFor(index, syntaxUID);
    made.mPixelLength = lengthOf(index, made.mPixels);
    const bool isOpen =
        made.mPixels == Pixels::Encoded || (made.mPixels == Pixels::Stored && index.isEncapsulated());
    if (made.mPixelLength >= kUndefinedLength && !isOpen)
        return Result::failure(QStringLiteral("The pixels are too long for one attribute"));
    if (made.mPixels == Pixels::Decoded && made.mPixelLength <= 0)
        return Result::failure(QStringLiteral("It is not told how large the pixels are"));
    if (made.mPixels == Pixels::Decoded || made.mPixels == Pixels::Encoded) {
        describePixels(dataset, made.mPixels == Pixels::Decoded ? index.decodedPhotometric()
                                                                : index.encodedPhotometric());
        result = decodeIcons(dataset);
        if (result.bad())
            return result;
    }
    const std::unique_ptr<DcmDataset> tail = takeTail(dataset);
    E_TransferSyntax xfer = isExplicit ? EXS_LittleEndianExplicit : EXS_LittleEndianImplicit;
    // Icons may be compressed as well.
    if (index.isEncapsulated() && isStored && dataset.getOriginalXfer() != EXS_Unknown)
        xfer = dataset.getOriginalXfer();
    result = writeMeta(dicom, image, syntaxUID, made.mHead);
    made.mMetaLength = made.mHead.size();
    if (result.good())
        result = written(dataset, made.mHead, xfer, EGL_withoutGL);
    if (result.good() && tail->card() > 0)
        result = written(*tail, made.mTail, xfer, EGL_withoutGL);
    if (result.bad())
        return result;
    if (index.hasPixels())
        made.mHead += pixelHead(index, isExplicit, vrOf(index, made.mPixels, dataset),
                                isOpen ? kUndefinedLength : made.mPixelLength);
    *this = made;
    return {};
}

}  // namespace Kdd
