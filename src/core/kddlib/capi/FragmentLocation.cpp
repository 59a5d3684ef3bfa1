#include "kddlib/capi/FragmentLocation.h"

#include "kddlib/net/dicom/DicomParse.h"
#include "kddlib/net/dicom/LocalFileStream.h"
#include "platform/os/RandomAccessFile.h"
#include "platform/volume/FragmentReader.h"

#include <QtEndian>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcfilefo.h>
#include <dcmtk/dcmdata/dcpixseq.h>
#include <dcmtk/dcmdata/dcpxitem.h>

#include <cstring>

namespace Kdd
{

namespace
{

// Tag and length. Encapsulated pixel data is little-endian in every file.
constexpr qint64 kItemHeaderSize = 8;
constexpr unsigned char kItemTag[] = {0xfe, 0xff, 0x00, 0xe0};

/// Null when the pixel data are not encapsulated, or when there are none.
DcmPixelSequence* fragmentsOf(DcmFileFormat& file)
{
    DcmElement* pixelData = nullptr;
    E_TransferSyntax xfer = EXS_Unknown;
    if (file.getDataset()->findAndGetElement(DCM_PixelData, pixelData).bad())
        return nullptr;
    return findFragments(*pixelData, xfer);
}

qint64 lengthOf(DcmPixelSequence& sequence, unsigned long item)
{
    DcmPixelItem* found = nullptr;
    return sequence.getItem(found, item).good() ? qint64{found->getLengthField()} : 0;
}

/// Where the value of Pixel Data begins: the parser tells no positions, but it stops there when it is asked to.
qint64 positionOfPixelData(const char* path)
{
    DepthLimited<LocalFileStream> stream(path);
    DcmFileFormat upToPixelData;
    ParseOptions options;
    options.reader = [&](DcmInputStream& from, Uint32 maxReadLength) {
        return upToPixelData.readUntilTag(from, EXS_Unknown, EGL_noChange, maxReadLength, DCM_PixelData);
    };
    parseDicom(stream, upToPixelData, options);
    return stream.tell();
}

/// Whether an item of that length begins at `position` and lies within the file.
bool hasItem(const RandomAccessFile& file, qint64 position, qint64 length)
{
    unsigned char header[kItemHeaderSize];
    return file.readAt(position, header, kItemHeaderSize) == kItemHeaderSize &&
           std::memcmp(header, kItemTag, sizeof kItemTag) == 0 &&
           qFromLittleEndian<quint32>(header + sizeof kItemTag) == length &&
           length <= file.size() - position - kItemHeaderSize;
}

}  // namespace

bool locateFirstFragment(const char* path, DcmFileFormat& file, FragmentLocation& location)
{
    // The first item of the sequence is the table of offsets.
    DcmPixelSequence* const sequence = fragmentsOf(file);
    if (sequence == nullptr || sequence->card() < 2)
        return false;
    const qint64 tableLength = lengthOf(*sequence, 0);
    const qint64 length = lengthOf(*sequence, 1);
    const qint64 table = positionOfPixelData(path);
    const qint64 fragment = table + kItemHeaderSize + tableLength;
    // Looked at in the file itself: the parser's lengths may be those of a file that was replaced since.
    RandomAccessFile bytes;
    if (bytes.open(path).bad() || !hasItem(bytes, table, tableLength) || !hasItem(bytes, fragment, length))
        return false;
    // Two items are the table of offsets and one fragment.
    location = {fragment + kItemHeaderSize, length, sequence->card() == 2};
    return true;
}

}  // namespace Kdd
