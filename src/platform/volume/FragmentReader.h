#pragma once

#include "platform/base/Result.h"
#include "platform/volume/KxCompressedDataMedia.h"

#include <QByteArray>
#include <QVector>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcfcache.h>
#include <dcmtk/dcmdata/dcxfer.h>

class DcmElement;
class DcmPixelItem;
class DcmPixelSequence;

namespace Kdd
{

/// The compressed pixel data and their transfer syntax; null when they are not compressed. A syntax that DCMTK does not
/// know appears as one without compression. Owned by the element.
DcmPixelSequence* findFragments(DcmElement& pixelData, E_TransferSyntax& xfer);

/// What a compressed stream begins with tells more reliably than the transfer syntax what it is.
enum class Codestream { Jpeg, Jpeg2000, JpegXl, Unknown };

Codestream recognizeCodestream(const QByteArray& bytes);

/// The compressed bytes of one of `frames` frames. Which fragments belong to it is told by their number, by the offset
/// table, or else by where codestreams begin. Only what is asked for is read from the file.
Result readFrameBytes(DcmPixelSequence& sequence, int frame, int frames, QByteArray& bytes);

/// The fragments of a pixel sequence as one stretch of bytes, read where it is asked for. The sequence must outlive it.
class FragmentSource : public MediaSource
{
public:
    explicit FragmentSource(DcmPixelSequence& sequence);
    qint64 size() const override { return mSize; }
    qint64 read(qint64 offset, char* out, qint64 length) override;

private:
    struct Fragment
    {
        DcmPixelItem* item;
        qint64 offset;
        qint64 size;
    };

    QVector<Fragment> mFragments;
    qint64 mSize = 0;
    DcmFileCache mFile;  // open between reads
};

}  // namespace Kdd
