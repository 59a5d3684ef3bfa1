#pragma once

#include "kddlib/tagmodel/VolumeImages.h"
#include "platform/base/Export.h"
#include "platform/base/Geometry.h"
#include "platform/volume/KxHistogram.h"

#include <QByteArray>
#include <QList>
#include <QVector>

#include <boost/optional.hpp>

#include <string>
#include <vector>

namespace Kdd
{

class KxMsg;
class TagFile;
class TagMap;
struct VolumeInfo;

/// Which image of a volume holds a slice, and which of its frames.
struct Slice
{
    qint32 image = -1;  ///< index in the volume's images; -1 when the image is unknown
    qint32 frame = 0;   ///< 0 for images of one frame
};

/// The slices of a stack, in order.
///
/// Nearly every stack has one slice per image, in the order of the images or in the reverse order. Such a run
/// is kept as its length alone, so that the length that a file claims costs no memory. Each thread uses a copy of its
/// own.
class KDD_EXPORT SliceList
{
public:
    enum class Run { None, Ascending, Descending };

    SliceList() = default;
    explicit SliceList(const QVector<Slice>& slices);

    /// `count` slices of frame 0 of the images 0, 1, 2, ... or, descending, of the images count - 1, ..., 1,
    /// 0.
    static SliceList ofRun(Run run, int count);

    /// A single slice of image 0 ascends; an empty list is no run.
    Run run() const { return mRun; }

    int size() const { return mRun == Run::None ? mListed.size() : mCount; }

    /// 0 <= i < size().
    Slice at(int i) const;

private:
    QVector<Slice> mListed;
    int mCount = 0;  // of a run
    Run mRun = Run::None;
};

/// A stack of slices: images of one series, or the frames of multi-frame images, with what a viewer needs to
/// load them without opening the DICOM files.
///
/// Hangs below a series, which owns it. It points to images of the study's tree without owning them. An image
/// that goes away or leaves its series leaves the volume too; its slices stay, with an unknown image.
///
/// A copy names the same images. Used by one thread at a time: the rescale values and the hash are computed
/// by the first const query and kept.
class KDD_EXPORT Volume
{
public:
    /// The index stays -1 until a series takes the volume over.
    Volume() = default;
    explicit Volume(int volumeIndex)
        : mVolumeIndex(volumeIndex)
    {
    }

    /// The number under which the images of the series name this volume in (0006,7103).
    int volumeIndex() const { return mVolumeIndex; }

    // ---- images and slices

    int numImages() const { return images().size(); }

    /// Null when there is no such image. Owned by the study's tree.
    TagMap* image(int i) const;

    const SliceList& slices() const;

    /// The image that holds the slice, and the frame in it. Null when the slice's image is unknown. Without
    /// such a slice the image of that number, with -1 as frame: a volume without slices has one per image.
    TagMap* imageForSlice(int slice, int& frame) const;

    /// Whether there are more slices than images.
    bool isMultiFrame() const { return mSlices.size() > numImages(); }

    /// The SOP Instance UID of each slice whose image is known, followed by "." and the frame number if the
    /// volume is multi-frame.
    std::vector<std::string> sopUIDList() const;

    /// MD5 of the texts of `sopUIDList` one after the other, as 32 upper-case hexadecimal digits. Computed
    /// once: it stays when images change later.
    QByteArray volumeHash() const;
    void volumeHash(std::string& out) const;

    /// A copy inside `series`, with a copy of every image under a new SOP Instance UID, which are added to the tag
    /// file; `series` must be one of its series. The slices, geometry, rescale slope and intercept and padding are
    /// taken over, the rest is not. The copy belongs to `series`.
    Volume* duplicate(TagFile& tagFile, TagMap& series) const;

    // ---- geometry

    /// Columns, rows and slices.
    Vec3i dims() const { return mDims; }

    /// Extent in patient space [mm]; at first an empty box.
    void getBoundingBox(Box3f& box) const { box = mBoundingBox; }

    /// From voxels to patient space.
    void getTransformationMatrix(Mat4f& matrix) const { matrix = mTransformation; }

    /// Whether nothing is known but the volume's existence: it has no columns.
    bool isBareVolume() const { return mDims.x == 0; }

    void setGeometry(const Vec3i& dims, const Box3f& box, const Mat4f& transformation);

    // ---- values

    /// One slope and intercept for all images, computed from them when none was set.
    float rescaleSlope() const;
    float rescaleIntercept() const;

    /// What mapping all images onto one slope costs [bits].
    float precisionBitLoss() const;

    /// A slope of 0 stands for values that are not known yet.
    void setRescale(float slope, float intercept, float precisionBitLoss);

    /// Stored values from the padding value to the limit (or the one value, without limit) are no
    /// measurements.
    boost::optional<qint32> paddingValue() const { return mPaddingValue; }
    boost::optional<qint32> paddingRangeLimit() const { return mPaddingRangeLimit; }
    void setPadding(const boost::optional<qint32>& value, const boost::optional<qint32>& rangeLimit);

    /// Of the stored values.
    const KxHistogram& histogram() const { return mHistogram; }
    void setHistogram(const KxHistogram& histogram) { mHistogram = histogram; }

    /// How many of the images lost information by compression.
    int numLossyCompressedImages() const { return mNumLossyCompressedImages; }
    void setNumLossyCompressedImages(int count) { mNumLossyCompressedImages = count; }

    int numOverlayPlanes() const { return mNumOverlayPlanes; }
    void setNumOverlayPlanes(int count) { mNumOverlayPlanes = count; }

    // ---- preview, a JPEG image

    bool hasPreview() const { return !mPreviewData.isEmpty(); }
    QByteArray previewData() const { return mPreviewData; }
    void setPreviewData(const QByteArray& jpeg) { mPreviewData = jpeg; }
    void clearPreview() { mPreviewData.clear(); }

    // ---- the volume file

    QByteArray volumeFileName() const { return mVolumeFileName; }
    void setVolumeFileName(const QByteArray& name) { mVolumeFileName = name; }

    /// Tells apart the files of a series' volumes; what the tag file says of a volume holds only for the file
    /// of this suffix.
    QByteArray fileNameSuffix() const { return mFileNameSuffix; }
    void setFileNameSuffix(const QByteArray& suffix) { mFileNameSuffix = suffix; }

    /// The suffix of a file name: what follows its first "-" (or all of it) up to the first "."; of the name
    /// of a part ("..._part007...") what precedes "part", and the number without leading zeros.
    static QByteArray fileNameSuffix(const char* fileName);

    // ---- tag file records

    /// Appends the volume as one record with its length. The preview goes to `blobs`, the images are not
    /// named.
    void serialize(KxMsg& out, QList<QByteArray>& blobs) const;

    /// Reads a record (without its length) that is all of `in`, as the volume of that index. False, the
    /// message failed and the volume as it was, when the record is damaged. The volume has no images then;
    /// padding values are those of unsigned images until `attachImages`.
    bool deserialize(KxMsg& in, const QList<QByteArray>& blobs, int volumeIndex);

    /// The part of the record that only volumes with a file name suffix have.
    void serializeExtraData(KxMsg& out) const;
    void deserializeExtraData(KxMsg& in);

protected:
    friend class QAVolumes;
    friend class StudyVolumes;
    friend class TagMap;
    friend class VolumeSettling;

    /// Makes these the images, sorted by Instance Number and then by SOP Instance UID; the slices stay.
    /// Without images `single` is appended to those already there, unless it is null.
    void setImages(const QVector<TagMap*>& images, TagMap* single);

    /// Sorts the images and maps the slices. Each identifier, a SOP Instance UID, "." and a frame number, is
    /// one slice. Without identifiers there is one slice per image: the k-th slice is the image that was the
    /// k-th before sorting.
    void setMultiFrameInfo(const std::vector<std::string>& frameIdentifiers);

    /// Takes over all that a volume file says; the images are those found of it, in the file's order.
    void setInfo(const VolumeInfo& info, const QVector<TagMap*>& images);

    void setSlices(const QVector<Slice>& slices) { mSlices = SliceList(slices); }

    /// Completes a volume that was read by its index and its images.
    void attachImages(int volumeIndex, const QVector<TagMap*>& images);

    /// Puts the images into the order and number in which `attachImages` would have them, given these; every slice
    /// keeps its image. False, with nothing changed, when these are not the volume's images.
    bool arrangeLike(const QVector<TagMap*>& images);

    void initRescaleSlopeIntercept() const;

    /// Whether the tag file can hold suffix, rescale values, padding and histogram: there must be a suffix
    /// and a histogram of fewer than 65536 bins with fewer than 2^32 values.
    bool hasExtraData() const;

private:
    const QVector<TagMap*>& images() const;
    void forgetImage(int i);
    void closeGaps() const;

    qint32 mVolumeIndex = -1;
    mutable VolumeImages mImages;  // gaps are closed when the images are next asked for
    mutable SliceList mSlices;
    Vec3i mDims;
    Box3f mBoundingBox;
    Mat4f mTransformation;
    QByteArray mVolumeFileName;
    QByteArray mPreviewData;
    mutable QByteArray mVolumeHash;
    QByteArray mFileNameSuffix;
    mutable float mRescaleSlope = 0;
    mutable float mRescaleIntercept = 0;
    mutable float mPrecisionBitLoss = 0;
    qint32 mNumLossyCompressedImages = 0;
    boost::optional<qint32> mPaddingValue;
    boost::optional<qint32> mPaddingRangeLimit;
    KxHistogram mHistogram;
    qint32 mNumOverlayPlanes = 0;
};

}  // namespace Kdd

Q_DECLARE_TYPEINFO(Kdd::Slice, Q_PRIMITIVE_TYPE);
