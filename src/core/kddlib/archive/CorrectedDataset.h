#pragma once

#include "kddlib/items/FrameIndex.h"
#include "platform/base/Export.h"
#include "platform/base/Result.h"

#include <QByteArray>

#include <utility>

namespace Kdd
{

class MediaSource;
class TagMap;

/// Where an image's DICOM file lies, and what the file says of itself, as the tag file remembers it: not what the image
/// shows, for that may have been corrected. A value. Each thread uses a copy of its own.
struct KDD_EXPORT ImageOrigin
{
    QByteArray path;  ///< or URL
    QByteArray studyInstanceUID;
    QByteArray sopInstanceUID;  ///< empty where the file has none

    /// Fails when the tag file does not know the file, or not what corrections have changed.
    static Result of(const TagMap& image, ImageOrigin& origin);

    /// Whether what was found in a file is that image.
    bool isIn(const FrameIndex& file) const
    {
        return file.studyInstanceUID() == studyInstanceUID && file.sopInstanceUID() == sopInstanceUID;
    }
};

/// An image as a DICOM file that shows what its tag file shows: attributes from there, values that were left out there
/// and the pixels from its own DICOM file. Own attributes of group 0006 stay out; the meta header names the image and
/// the transfer syntax as they are then.
///
/// Made in pieces, so that pixels need not pass through memory: `head`, the pixels, `tail`. A value. Each thread uses a
/// copy of its own.
class KDD_EXPORT CorrectedDataset
{
public:
    /// Where the pixels come from.
    enum class Pixels {
        None,     ///< there are none
        Stored,   ///< the bytes of the file's `pixelValue`
        Decoded,  ///< as `DecodedPixels` gives them
        Encoded,  ///< as `EncodedPixels` gives them
    };

    /// Makes it from the image's file and what was found in it. `syntaxUID` is the file's own transfer syntax, one of
    /// its `FrameIndex::encodings`, or explicit, implicit or deflated VR little endian. Fails when the file cannot be read, or does not have what the tag file
    /// left out, so that it cannot be the one that the image was made from; nothing is changed then.
    Result make(MediaSource& file, const FrameIndex& index, const TagMap& image, const QByteArray& syntaxUID);

    /// Whether nothing of it differs from the file, syntax included, so that the file itself may be given.
    bool isAsInFile() const { return mIsAsInFile; }

    const QByteArray& head() const { return mHead; }

    /// How much of the head is preamble and meta header [bytes]. In deflated syntax whatever follows has yet to be
    /// deflated, pixels and tail included.
    int metaLength() const { return mMetaLength; }
    const QByteArray& tail() const { return mTail; }
    Pixels pixels() const { return mPixels; }

    /// Of the pixels [bytes]; of encoded ones, which nobody knows before, -1.
    qint64 pixelLength() const { return mPixelLength; }

private:
    QByteArray mHead;
    QByteArray mTail;
    int mMetaLength = 0;
    Pixels mPixels = Pixels::None;
    qint64 mPixelLength = 0;
    bool mIsAsInFile = false;
};

/// The decoded pixels of a file in blocks, as a dataset holds them: frame after frame as `FrameIndex::readDecoded` gives
/// it, single bits without gaps between frames, and a NUL if the length is odd. The source must outlive it. Used by one thread at a
/// time.
class KDD_EXPORT DecodedPixels
{
public:
    DecodedPixels(MediaSource& file, const FrameIndex& index)
        : mFile(file)
        , mIndex(index)
    {
    }

    /// Of all of them together [bytes], even; 2^32 - 1, which no attribute can have, for more than that.
    static qint64 lengthOf(const FrameIndex& index);

    /// Replaces `block` by the next bytes, those of a frame; empty at the end.
    Result next(QByteArray& block);

private:
    void append(const QByteArray& frame, QByteArray& block);

    MediaSource& mFile;
    FrameIndex mIndex;
    int mFrame = 0;
    int mBits = 0;          // of the last byte that are not given yet
    unsigned mPending = 0;  // those
    qint64 mGiven = 0;      // [bytes]
};

/// The pixels of a file in blocks, as a dataset in another transfer syntax with compression holds them: an empty table of
/// offsets, a fragment for each frame as `FrameIndex::readEncoded` gives it, and the delimiter. The source must outlive
/// it. Used by one thread at a time.
class KDD_EXPORT EncodedPixels
{
public:
    EncodedPixels(MediaSource& file, const FrameIndex& index, QByteArray syntaxUID)
        : mFile(file)
        , mIndex(index)
        , mSyntaxUID(std::move(syntaxUID))
    {
    }

    /// Replaces `block` by the next bytes, those of a frame; empty at the end.
    Result next(QByteArray& block);

private:
    MediaSource& mFile;
    FrameIndex mIndex;
    QByteArray mSyntaxUID;
    int mFrame = 0;
    bool mIsEnded = false;
};

}  // namespace Kdd
