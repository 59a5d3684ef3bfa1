#pragma once

#include "platform/base/Export.h"
#include "platform/base/Result.h"

#include <QByteArray>
#include <QVector>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctagkey.h>

#include <memory>

namespace Kdd
{

class MediaSource;

/// Consecutive bytes of a file.
struct FileStretch
{
    qint64 offset = 0;
    qint64 length = 0;

    qint64 end() const { return offset + length; }
};

/// One step of the way to an attribute: its key, and which item of it (0-based) the next step goes into.
struct ElementStep
{
    DcmTagKey key;
    int item = 0;
};

/// Where in a DICOM file its frames lie, and what it says of itself. Found without reading pixels: heads of elements and
/// of fragments, and the offset table.
///
/// For files as nearly all are: with preamble and meta header, little endian, not deflated as a whole. Others go through
/// `readAsRegularFile` first. All that is told lies within the file as it was read; whoever reads from it later makes
/// sure that it is the same file still.
///
/// A value; copies share what was found, and any number of threads may use them at the same time.
class KDD_EXPORT FrameIndex
{
public:
    FrameIndex();
    ~FrameIndex();
    FrameIndex(const FrameIndex&);
    FrameIndex& operator=(const FrameIndex&);

    /// Fails, with the index as it was, for a file that is damaged or of another kind than the ones above.
    Result read(MediaSource& file);

    // ---- what the file says

    const QByteArray& transferSyntaxUID() const;
    const QByteArray& studyInstanceUID() const;
    const QByteArray& sopInstanceUID() const;  ///< empty in the few kinds of objects that have none

    /// Where the dataset begins: behind preamble and meta header [bytes].
    qint64 datasetOffset() const;

    /// Of the element with the pixels: from its tag on to where the next element begins. Of length 0 and at the end of
    /// the file when there is none.
    FileStretch pixelElement() const;

    /// Of its value; of encapsulated pixels with offset table and delimiters.
    FileStretch pixelValue() const;

    bool hasPixels() const { return pixelElement().length > 0; }
    bool isEncapsulated() const;

    /// Pixel Data, Float Pixel Data or Double Float Pixel Data.
    DcmTagKey pixelKey() const;

    /// "OB" or "OW", or what else stands there; of a file with implicit VR what belongs there.
    QByteArray pixelVr() const;

    // ---- frames, 0-based

    /// A video counts as one frame: its frames cannot be told apart without decoding it. 0 without pixels.
    int frames() const;

    /// Where the bytes of a frame lie: one stretch, or its fragments in order, with the padding that was stored. Fails for
    /// a frame that is not there, that the file is too short for, that does not begin and end at whole bytes, or whose
    /// fragments cannot be told from those of others.
    Result locate(int frame, QVector<FileStretch>& stretches) const;

    /// The bytes of a frame as stored, read from the file; single bits are moved to begin at a byte.
    Result readStored(MediaSource& file, int frame, QByteArray& bytes) const;

    /// Whether there is a decoder for the file's transfer syntax.
    bool canDecode() const;

    /// The bytes of a frame as an uncompressed file in little endian would hold it if the frame were its only one. Of
    /// pixels that were compressed the samples are side by side, and what they mean is `decodedPhotometric`.
    Result readDecoded(MediaSource& file, int frame, QByteArray& bytes) const;

    /// Bits that a frame takes when it is not compressed; 0 when the file does not tell that sensibly.
    qint64 decodedBits() const;

    QByteArray decodedPhotometric() const;

    /// The transfer syntaxes with compression in which frames can be given beside the stored one, without loss of what
    /// decoding gives; those that cost least come first. Empty when there is no decoder for the stored one.
    QVector<QByteArray> encodings() const;

    /// The bytes of a frame in one of `encodings`, an even number. Samples are side by side, chroma is not shared.
    Result readEncoded(MediaSource& file, int frame, const QByteArray& syntaxUID, QByteArray& bytes) const;

    /// What the samples mean then.
    QByteArray encodedPhotometric() const;

    // ---- other values

    /// Where the value of an attribute lies, also of one in sequences. False when it is not there.
    bool findValue(MediaSource& file, const QVector<ElementStep>& steps, FileStretch& value) const;

    /// What the index takes in memory [bytes].
    qint64 cost() const;

    struct Private;

private:
    Result bitsOf(int frame, qint64& first, qint64& bits) const;
    Result locateFragments(int frame, QVector<FileStretch>& stretches) const;

    std::shared_ptr<const Private> d;
};

}  // namespace Kdd
