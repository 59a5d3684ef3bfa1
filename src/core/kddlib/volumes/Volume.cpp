#include "kddlib/volumes/Volume.h"

#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/RescaleSlopeCalculator.h"
#include "kddlib/volumes/VolumeInfo.h"

#include <QCryptographicHash>
#include <QHash>
#include <QSet>

#include <dcmtk/dcmdata/dcdeftag.h>

#include <algorithm>
#include <cstring>

namespace Kdd
{

namespace
{

constexpr int kSixteenBitBuffer = 2;
constexpr int kDefaultBitsStored = 8;
// A tag file has two bytes for the number of bins and four for what is in each.
constexpr int kMaxHistogramBins = 0x10000;
constexpr quint64 kMaxHistogramTotal = quint64(1) << 32;

const char* const kPart = "_part";

QByteArray sopUIDOf(const TagMap& image)
{
    QByteArray uid;
    image.findAndGetString(DCM_SOPInstanceUID, uid);
    return uid;
}

/// In the order that a reader of the tag file restores: by Instance Number and then by UID.
struct SortedImage
{
    TagMap* image;
    QByteArray sopUID;
    int instanceNumber;
    int position;  // in the vector given

    bool operator<(const SortedImage& other) const
    {
        if (instanceNumber != other.instanceNumber)
            return instanceNumber < other.instanceNumber;
        return std::strcmp(sopUID.constData(), other.sopUID.constData()) < 0;
    }
};

QVector<SortedImage> sorted(const QVector<TagMap*>& images)
{
    QVector<SortedImage> order;
    order.reserve(images.size());
    for (TagMap* image : images) {
        SortedImage entry = {image, sopUIDOf(*image), 0, order.size()};
        image->findAndGetInt(DCM_InstanceNumber, entry.instanceNumber);
        order.append(entry);
    }
    std::stable_sort(order.begin(), order.end());
    return order;
}

QVector<TagMap*> imagesOf(const QVector<SortedImage>& order)
{
    QVector<TagMap*> images;
    images.reserve(order.size());
    for (const SortedImage& entry : order)
        images.append(entry.image);
    return images;
}

/// The text before `position`; all of it when that is negative, the position of what is not found.
QByteArray before(const QByteArray& text, int position)
{
    return position >= 0 ? text.left(position) : text;
}

/// The first value as a number; an empty attribute counts as absent.
float floatOf(const TagMap& image, const DcmTagKey& key, float otherwise)
{
    QByteArray text;
    image.findAndGetString(key, text);
    const QByteArray first = before(text, text.indexOf('\\')).trimmed();
    return first.isEmpty() ? otherwise : first.toFloat();
}

bool hasSignedPixels(const TagMap& image)
{
    int representation = 0;
    return image.findAndGetInt(DCM_PixelRepresentation, representation) && representation == 1;
}

/// An image that does not say how many bits it stores counts as one of 8.
void addImage(RescaleSlopeCalculator& calculator, const TagMap& image)
{
    int bits = 0;
    if (!image.findAndGetInt(DCM_BitsStored, bits))
        bits = kDefaultBitsStored;
    calculator.add(floatOf(image, DCM_RescaleSlope, 1), floatOf(image, DCM_RescaleIntercept, 0), bits,
                   hasSignedPixels(image));
}

/// The number of a part without leading zeros; nothing is left of a number that is all zeros.
QByteArray partNumber(const QByteArray& text)
{
    int start = 0;
    while (start < text.size() && text.at(start) == '0')
        ++start;
    int end = start;
    while (end < text.size() && text.at(end) >= '0' && text.at(end) <= '9')
        ++end;
    return text.mid(start, end - start);
}

void extendSign(boost::optional<qint32>& value)
{
    if (value)
        value = static_cast<qint16>(*value);
}

}  // namespace

SliceList SliceList::ofRun(Run run, int count)
{
    SliceList slices;
    slices.mRun = count > 0 ? run : Run::None;
    slices.mCount = count;
    return slices;
}

SliceList::SliceList(const QVector<Slice>& slices)
{
    if (slices.isEmpty())
        return;
    // A list that does not begin with image 0 can only descend; whether
    // it is a run at all is seen slice by slice.
    const SliceList run = ofRun(slices.first().image == 0 ? Run::Ascending : Run::Descending, slices.size());
    for (int i = 0; i < slices.size(); ++i) {
        if (slices.at(i).image != run.at(i).image || slices.at(i).frame != 0) {
            mListed = slices;
            return;
        }
    }
    *this = run;
}

Slice SliceList::at(int i) const
{
    switch (mRun) {
    case Run::Ascending:
        return {i, 0};
    case Run::Descending:
        return {mCount - 1 - i, 0};
    case Run::None:
        break;
    }
    return mListed.at(i);
}

/// Closing the gaps takes time by the number of images, so those of many images that leave are closed together.
const QVector<TagMap*>& Volume::images() const
{
    if (mImages.hasGaps())
        closeGaps();
    return mImages.list();
}

/// The images move together and get other numbers; a slice whose image has left names none.
void Volume::closeGaps() const
{
    const QVector<int> places = mImages.closeGaps();
    QVector<Slice> slices;
    slices.reserve(mSlices.size());
    for (int i = 0; i < mSlices.size(); ++i) {
        const Slice slice = mSlices.at(i);
        slices.append({places.value(slice.image, -1), slice.frame});
    }
    mSlices = SliceList(slices);
}

/// Its slices stay, with an unknown image: a viewer must not show another image in their place.
void Volume::forgetImage(int i)
{
    QVector<TagMap*> left = mImages.list();
    left[i] = nullptr;
    mImages.set(left);
}

const SliceList& Volume::slices() const
{
    images();
    return mSlices;
}

TagMap* Volume::image(int i) const
{
    return images().value(i, nullptr);
}

TagMap* Volume::imageForSlice(int slice, int& frame) const
{
    if (slice < 0 || slice >= mSlices.size()) {
        frame = -1;
        return image(slice);
    }
    const Slice entry = slices().at(slice);
    frame = entry.frame;
    return image(entry.image);
}

std::vector<std::string> Volume::sopUIDList() const
{
    std::vector<std::string> identifiers;
    identifiers.reserve(static_cast<std::size_t>(numImages()));
    for (int i = 0; i < mSlices.size(); ++i) {
        const Slice slice = slices().at(i);
        const TagMap* holder = image(slice.image);
        if (holder == nullptr)
            continue;
        QByteArray identifier = sopUIDOf(*holder);
        if (isMultiFrame())
            identifier += '.' + QByteArray::number(slice.frame);
        identifiers.push_back(identifier.toStdString());
    }
    return identifiers;
}

QByteArray Volume::volumeHash() const
{
    if (!mVolumeHash.isEmpty())
        return mVolumeHash;
    QCryptographicHash hash(QCryptographicHash::Md5);
    for (const std::string& identifier : sopUIDList())
        hash.addData(identifier.data(), static_cast<int>(identifier.size()));
    mVolumeHash = hash.result().toHex().toUpper();
    return mVolumeHash;
}

void Volume::volumeHash(std::string& out) const
{
    out = volumeHash().toStdString();
}

void Volume::setGeometry(const Vec3i& dims, const Box3f& box, const Mat4f& transformation)
{
    mDims = dims;
    mBoundingBox = box;
    mTransformation = transformation;
}

/// A slope of 0 is none: nothing was set, so it is computed from the images.
float Volume::rescaleSlope() const
{
    if (mRescaleSlope == 0)
        initRescaleSlopeIntercept();
    return mRescaleSlope;
}

float Volume::rescaleIntercept() const
{
    if (mRescaleSlope == 0)
        initRescaleSlopeIntercept();
    return mRescaleIntercept;
}

float Volume::precisionBitLoss() const
{
    if (mRescaleSlope == 0)
        initRescaleSlopeIntercept();
    return mPrecisionBitLoss;
}

void Volume::initRescaleSlopeIntercept() const
{
    RescaleSlopeCalculator calculator(kSixteenBitBuffer);
    for (const TagMap* image : images())
        addImage(calculator, *image);
    mRescaleSlope = calculator.rescaleSlope();
    mRescaleIntercept = calculator.rescaleIntercept();
    mPrecisionBitLoss = calculator.precisionBitLoss();
}

void Volume::setRescale(float slope, float intercept, float precisionBitLoss)
{
    mRescaleSlope = slope;
    mRescaleIntercept = intercept;
    mPrecisionBitLoss = precisionBitLoss;
}

void Volume::setPadding(const boost::optional<qint32>& value, const boost::optional<qint32>& rangeLimit)
{
    mPaddingValue = value;
    mPaddingRangeLimit = rangeLimit;
}

/// "1.2-volume_part007.vol" has the suffix "volume_7", and "1.2-volume.vol" has "volume".
QByteArray Volume::fileNameSuffix(const char* fileName)
{
    const QByteArray name(fileName);
    const QByteArray rest = name.mid(name.indexOf('-') + 1);
    const int part = rest.indexOf(kPart);
    if (part >= 0)
        return rest.left(part + 1) + partNumber(rest.mid(part + static_cast<int>(std::strlen(kPart))));
    return before(rest, rest.indexOf('.'));
}

void Volume::setImages(const QVector<TagMap*>& images, TagMap* single)
{
    if (!images.isEmpty())
        mImages.set(imagesOf(sorted(images)));
    else if (single != nullptr)
        mImages.set(QVector<TagMap*>(this->images()) << single);
}

void Volume::setMultiFrameInfo(const std::vector<std::string>& frameIdentifiers)
{
    const QVector<SortedImage> order = sorted(images());
    mImages.set(imagesOf(order));
    QVector<Slice> slices;
    if (frameIdentifiers.empty()) {
        slices.resize(order.size());
        for (int i = 0; i < order.size(); ++i)
            // The slices are those of the volume file, in its order; only the numbers of the images change.
            slices[order.at(i).position].image = i;
    }
    // Of several images of one UID the last answers.
    QHash<QByteArray, int> indexes;
    for (int i = 0; i < order.size(); ++i)
        indexes.insert(order.at(i).sopUID, i);
    for (const std::string& each : frameIdentifiers) {
        const QByteArray identifier = QByteArray::fromStdString(each);
        const int dot = identifier.lastIndexOf('.');
        const int frame = dot >= 0 ? identifier.mid(dot + 1).toInt() : 0;
        // An image that is not held stays unknown, so that the slices after it keep their places.
        slices.append({indexes.value(before(identifier, dot), -1), frame});
    }
    setSlices(slices);
}

void Volume::setInfo(const VolumeInfo& info, const QVector<TagMap*>& images)
{
    mImages.set(images);
    setMultiFrameInfo(info.frameIdentifiers);
    setGeometry(info.dims, info.boundingBox, info.transformation);
    mPreviewData = info.preview;
    mFileNameSuffix = fileNameSuffix(info.name.constData());
    setRescale(info.rescaleSlope, info.rescaleIntercept, info.precisionBitLoss);
    setPadding(info.paddingValue, info.paddingRangeLimit);
    mNumLossyCompressedImages = info.numLossyCompressedImages;
    mNumOverlayPlanes = info.numOverlayPlanes;
    mHistogram = info.histogram;
}

void Volume::attachImages(int volumeIndex, const QVector<TagMap*>& images)
{
    mVolumeIndex = volumeIndex;
    setImages(images, nullptr);
    if (numImages() == 0 || !hasSignedPixels(*image(0)))
        return;
    // A record has 16 bits for each and no sign: only the images tell whether their values have one.
    extendSign(mPaddingValue);
    extendSign(mPaddingRangeLimit);
}

bool Volume::arrangeLike(const QVector<TagMap*>& images)
{
    const QVector<TagMap*> former = this->images();
    const QVector<TagMap*> order = imagesOf(sorted(images));
    if (order == former)
        return true;
    QHash<TagMap*, int> places;
    for (int i = 0; i < order.size(); ++i)
        places.insert(order.at(i), i);
    // As sets: the same images in another order are what this is for.
    if (QSet<TagMap*>(former.begin(), former.end()) != QSet<TagMap*>(order.begin(), order.end()))
        return false;
    QVector<Slice> slices;
    slices.reserve(mSlices.size());
    for (int i = 0; i < mSlices.size(); ++i) {
        const Slice slice = mSlices.at(i);
        slices.append({places.value(former.value(slice.image, nullptr), -1), slice.frame});
    }
    mImages.set(order);
    setSlices(slices);
    return true;
}

bool Volume::hasExtraData() const
{
    return !mFileNameSuffix.isEmpty() && mHistogram.numBins() < kMaxHistogramBins &&
           mHistogram.total() < kMaxHistogramTotal;
}

}  // namespace Kdd
