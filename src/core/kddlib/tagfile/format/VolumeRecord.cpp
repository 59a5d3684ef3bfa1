#include "kddlib/Limits.h"
#include "kddlib/tagfile/format/VolumeIndex.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/Volume.h"
#include "platform/base/KxMsg.h"

#include <cmath>
#include <memory>
#include <vector>

namespace Kdd
{

namespace
{

/// Length, dimensions, box, matrix, an empty name, the slice list code and no preview [bytes].
constexpr int kMinRecord = 2 + 12 + 24 + 64 + 2 + 1 + 2;

constexpr quint8 kExtraVersion = 0;
constexpr int kMaxShort = 0xFFFF;
constexpr int kMaxByte = 0xFF;

/// How the slices are stored.
enum class SliceCode : quint8 {
    InOrder = 1,       ///< not at all: one slice per image
    Reversed = 2,      ///< not at all: one slice per image, the last image first
    ShortIndexes = 3,  ///< 16-bit image indexes
    Indexes = 4,       ///< count and 32-bit image indexes
    ShortFrames = 5,   ///< pairs of 16-bit image index and frame
    Frames = 6,        ///< count and pairs of 32-bit image index and frame
};

/// 32-bit numbers, behind a count; the others are as many as the dimensions say.
bool isWide(SliceCode code)
{
    return code == SliceCode::Indexes || code == SliceCode::Frames;
}

bool hasFrames(SliceCode code)
{
    return code == SliceCode::ShortFrames || code == SliceCode::Frames;
}

bool isRun(SliceCode code)
{
    return code == SliceCode::InOrder || code == SliceCode::Reversed;
}

int countFromDims(const Vec3i& dims)
{
    return dims.x != 0 ? dims.z : 0;
}

bool isShort(int value)
{
    return value >= 0 && value <= kMaxShort;
}

/// What the numbers of a slice list allow.
struct SliceTraits
{
    bool haveShortNumbers = true;
    bool haveFrames = false;
};

SliceTraits traitsOf(const SliceList& slices)
{
    SliceTraits traits;
    // A run needs no look at its slices: its largest number follows from its length.
    traits.haveShortNumbers = slices.size() <= kMaxShort;
    for (int i = 0; i < slices.size() && slices.run() == SliceList::Run::None; ++i) {
        const Slice slice = slices.at(i);
        traits.haveShortNumbers = traits.haveShortNumbers && isShort(slice.image) && isShort(slice.frame);
        traits.haveFrames = traits.haveFrames || slice.frame != 0;
    }
    return traits;
}

/// The shortest code that gives back the same slices.
SliceCode sliceCode(const SliceList& slices, int numImages, const Vec3i& dims)
{
    const int count = slices.size();
    // The reader has the count of the short codes from the dimensions, and without columns takes it for 0.
    const bool dimsTellCount = count == dims.z && count == countFromDims(dims);
    const bool onePerImage = count > 0 && count == numImages;
    if (onePerImage && dimsTellCount && count <= kMaxRun && slices.run() != SliceList::Run::None)
        return slices.run() == SliceList::Run::Ascending ? SliceCode::InOrder : SliceCode::Reversed;
    const SliceTraits traits = traitsOf(slices);
    const bool fitsShort = dimsTellCount && traits.haveShortNumbers;
    if (onePerImage && !traits.haveFrames)
        return fitsShort ? SliceCode::ShortIndexes : SliceCode::Indexes;
    return fitsShort ? SliceCode::ShortFrames : SliceCode::Frames;
}

void writeNumber(KxMsg& out, qint32 number, SliceCode code)
{
    if (isWide(code)) {
        out << number;
        return;
    }
    out << static_cast<quint16>(number);
}

void writeSlices(KxMsg& out, const SliceList& slices, SliceCode code)
{
    out << static_cast<quint8>(code);
    if (isRun(code))
        return;
    if (isWide(code))
        out << static_cast<qint32>(slices.size());
    for (int i = 0; i < slices.size(); ++i) {
        const Slice slice = slices.at(i);
        writeNumber(out, slice.image, code);
        if (hasFrames(code))
            writeNumber(out, slice.frame, code);
    }
}

qint32 readNumber(KxMsg& in, SliceCode code)
{
    qint32 number = 0;
    quint16 shortNumber = 0;
    if (isWide(code)) {
        in >> number;
        return number;
    }
    in >> shortNumber;
    return shortNumber;
}

SliceList readRun(KxMsg& in, SliceCode code, int count)
{
    // A run takes no bytes in the file, so its length needs a bound of its own.
    if (count < 0 || count > kMaxRun) {
        in.setFailed();
        return {};
    }
    return SliceList::ofRun(
        code == SliceCode::InOrder ? SliceList::Run::Ascending : SliceList::Run::Descending, count);
}

SliceList readListed(KxMsg& in, SliceCode code, int count)
{
    const int sliceSize = (isWide(code) ? 4 : 2) * (hasFrames(code) ? 2 : 1);
    // Held against what is left before memory is taken.
    if (count < 0 || count > in.remaining() / sliceSize) {
        in.setFailed();
        return {};
    }
    QVector<Slice> slices(count);
    for (Slice& slice : slices) {
        slice.image = readNumber(in, code);
        slice.frame = hasFrames(code) ? readNumber(in, code) : 0;
    }
    return SliceList(slices);
}

SliceList readSlices(KxMsg& in, const Vec3i& dims)
{
    quint8 number = 0;
    in >> number;
    const auto code = static_cast<SliceCode>(number);
    if (in.failed() || code < SliceCode::InOrder || code > SliceCode::Frames) {
        in.setFailed();
        return {};
    }
    if (isRun(code))
        return readRun(in, code, countFromDims(dims));
    return readListed(in, code, isWide(code) ? readNumber(in, code) : countFromDims(dims));
}

void writeText(KxMsg& out, const QByteArray& text)
{
    TagMap::writeLength(out, text.size());
    out.write(text);
}

QByteArray readText(KxMsg& in)
{
    const int length = TagMap::readLength(in);
    return in.read(length);
}

void writePreview(KxMsg& out, const QByteArray& jpeg, QList<QByteArray>& blobs)
{
    if (!jpeg.isEmpty())
        blobs.append(jpeg);
    TagMap::writeLength(out, jpeg.isEmpty() ? 0 : blobs.size());
}

/// The low 16 bits; whether they are signed is known again when the volume has its images.
void writePadding(KxMsg& out, const boost::optional<qint32>& value)
{
    out << static_cast<quint8>(value ? 1 : 0);
    if (value)
        out << static_cast<quint16>(*value);
}

boost::optional<qint32> readPadding(KxMsg& in)
{
    quint8 isPresent = 0;
    quint16 value = 0;
    in >> isPresent;
    if (isPresent != 1)
        return boost::none;
    in >> value;
    return static_cast<qint32>(value);
}

quint16 shortLimit(double value)
{
    return std::isnan(value) ? quint16(0)
                             : static_cast<quint16>(std::lround(qBound(0.0, value, double(kMaxShort))));
}

void writeHistogram(KxMsg& out, const KxHistogram& histogram)
{
    out << shortLimit(histogram.minimum()) << shortLimit(histogram.maximum());
    out << static_cast<quint16>(histogram.numBins());
    // A volume whose counts do not fit 32 bits has no extra data.
    for (const quint64 bin : histogram.bins())
        out << static_cast<quint32>(bin);
}

KxHistogram readHistogram(KxMsg& in)
{
    quint16 minimum = 0;
    quint16 maximum = 0;
    quint16 count = 0;
    in >> minimum >> maximum >> count;
    if (count > in.remaining() / 4) {
        in.setFailed();
        return {};
    }
    QVector<quint64> bins(count);
    for (quint64& bin : bins) {
        quint32 low = 0;
        in >> low;
        bin = low;
    }
    return {bins, double(minimum), double(maximum)};
}

/// Whether the reader would find too many. Few images cannot name that many volumes, so they are not looked at.
bool namesTooManyImages(const TagMap& series)
{
    QVector<VolumeShare> unused;
    return qint64(series.children().size()) * (kMaxByte + 1) > kMaxVolumeImages &&
           !shareImages(series, QVector<bool>(series.volumes().size(), true), unused);
}

std::vector<std::unique_ptr<Volume>> readVolumes(KxMsg& in, const QList<QByteArray>& blobs)
{
    std::vector<std::unique_ptr<Volume>> volumes;
    const int count = TagMap::readLength(in);
    if (count < 0 || count > in.remaining() / kMinRecord)
        in.setFailed();
    for (int i = 0; i < count && !in.failed(); ++i) {
        const int length = TagMap::readLength(in);
        KxMsg record = in.readMessage(length);
        volumes.push_back(std::make_unique<Volume>());
        if (!volumes.back()->deserialize(record, blobs, i))
            in.setFailed();
    }
    return volumes;
}

}  // namespace

void TagMap::serializeVolumes(KxMsg& out, QList<QByteArray>& blobs) const
{
    if (namesTooManyImages(*this)) {
        out.setFailed();
        return;
    }
    // In a message of its own, because its length stands before it.
    KxMsg list;
    writeLength(list, volumes().size());
    for (const Volume* volume : volumes()) {
        volume->serialize(list, blobs);
        if (list.size() > kMaxBodySize) {
            out.setFailed();
            return;
        }
    }
    writeLength(out, list.size());
    out.write(list.bytes());
}

void TagMap::deserializeVolumes(KxMsg& in, const QList<QByteArray>& blobs)
{
    std::vector<std::unique_ptr<Volume>> volumes = readVolumes(in, blobs);
    if (volumes.empty() || in.failed())
        return;
    QVector<bool> haveSlices;
    for (const std::unique_ptr<Volume>& volume : volumes)
        haveSlices.append(volume->slices().size() > 0);
    QVector<VolumeShare> shares;
    // Every list goes through all the images, so a series has one; a file of nothing but lists would take
    // forever.
    if (!this->volumes().isEmpty() || !shareImages(*this, haveSlices, shares)) {
        in.setFailed();
        return;
    }
    QList<Volume*>& held = obtainVolumes();
    for (std::unique_ptr<Volume>& volume : volumes) {
        // One for each volume, in their order.
        const VolumeShare& share = shares.at(held.size());
        volume->attachImages(share.index, share.images);
        held.append(volume.release());
    }
}

void Volume::serialize(KxMsg& out, QList<QByteArray>& blobs) const
{
    KxMsg record;
    record << mDims << mBoundingBox << mTransformation;
    writeText(record, mVolumeFileName);
    writeSlices(record, slices(), sliceCode(slices(), numImages(), mDims));
    writePreview(record, mPreviewData, blobs);
    // Last, and without a mark: a reader knows of it by what is left of the record.
    if (hasExtraData())
        serializeExtraData(record);
    TagMap::writeLength(out, record.size());
    out.write(record.bytes());
}

bool Volume::deserialize(KxMsg& in, const QList<QByteArray>& blobs, int volumeIndex)
{
    // Read aside, so that a damaged record leaves this volume as it was.
    Volume volume(volumeIndex);
    in >> volume.mDims >> volume.mBoundingBox >> volume.mTransformation;
    volume.mVolumeFileName = readText(in);
    volume.mSlices = readSlices(in, volume.mDims);
    const int preview = TagMap::readLength(in);
    if (preview > 0)
        volume.mPreviewData = blobs.value(preview - 1);
    if (!in.failed() && in.remaining() > 0)
        volume.deserializeExtraData(in);
    if (in.failed())
        return false;
    *this = volume;
    return true;
}

void Volume::serializeExtraData(KxMsg& out) const
{
    out << kExtraVersion;
    writeText(out, mFileNameSuffix);
    out << mRescaleSlope << mRescaleIntercept << mPrecisionBitLoss;
    out << static_cast<quint16>(qBound(0, mNumLossyCompressedImages, kMaxShort));
    writePadding(out, mPaddingValue);
    writePadding(out, mPaddingRangeLimit);
    writeHistogram(out, mHistogram);
    out << static_cast<quint8>(qBound(0, mNumOverlayPlanes, kMaxByte));
}

void Volume::deserializeExtraData(KxMsg& in)
{
    quint8 version = 0;
    in >> version;
    // Of a later form nothing is known; what came before it is a volume all the same.
    if (version != kExtraVersion)
        return;
    quint16 numLossy = 0;
    quint8 numOverlays = 0;
    mFileNameSuffix = readText(in);
    in >> mRescaleSlope >> mRescaleIntercept >> mPrecisionBitLoss >> numLossy;
    mPaddingValue = readPadding(in);
    mPaddingRangeLimit = readPadding(in);
    mHistogram = readHistogram(in);
    in >> numOverlays;
    mNumLossyCompressedImages = numLossy;
    mNumOverlayPlanes = numOverlays;
}

}  // namespace Kdd
