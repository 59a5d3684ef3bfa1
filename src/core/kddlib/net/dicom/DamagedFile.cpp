#include "kddlib/net/dicom/DamagedFile.h"

#include "kddlib/net/dicom/DicomFileReader.h"
#include "kddlib/net/dicom/DicomParse.h"
#include "kddlib/net/dicom/ElementScan.h"
#include "platform/base/LogFile.h"
#include "platform/database/Kxg.h"
#include "platform/os/RandomAccessFile.h"

#include <QStringList>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcistrmb.h>

#include <algorithm>
#include <set>
#include <utility>

namespace Kdd
{

namespace
{

constexpr qint64 kMaxFileBytes = qint64{1} << 30;
// Bytes of any content that stand before the prefix.
constexpr qint64 kPreamble = 128;
// A file may be damaged in a thousand places, and its warning is one line.
constexpr int kNamesToTell = 10;
const QByteArray kSequenceEnd("\xfe\xff\xdd\xe0\0\0\0\0", 8);

bool readWhole(const char* path, QByteArray& bytes)
{
    RandomAccessFile file;
    // All in memory, for elements are looked at in any order; the bound keeps a damaged length from taking it all.
    if (file.open(path).bad() || file.size() > kMaxFileBytes)
        return false;
    bytes.resize(static_cast<int>(file.size()));
    return file.readAt(0, bytes.data(), bytes.size()) == bytes.size();
}

/// Data Set Trailing Padding, which means nothing and stands behind everything else.
QByteArray endMark(const DcmXfer& syntax)
{
    QByteArray mark("\xfc\xff\xfc\xff", 4);
    QByteArray length("\x10\0\0\0", 4);
    if (syntax.isBigEndian()) {
        std::reverse(mark.begin(), mark.end());
        std::reverse(length.begin(), length.end());
    }
    if (syntax.isExplicitVR())
        mark += QByteArray("OB\0\0", 4);
    return mark + length + QByteArray(16, '\0');
}

/// What the parser makes of the elements of a dataset. Good only when it comes to their end, which a mark shows; the
/// parser also wants more bytes to be there than a short element has.
OFCondition parse(const QByteArray& elements, E_TransferSyntax syntax, DcmFileFormat& file)
{
    const QByteArray bytes = elements + endMark(DcmXfer(syntax));
    DepthLimited<DcmInputBufferStream> stream;
    stream.setBuffer(bytes.constData(), bytes.size());
    stream.setEos();
    ParseOptions options;
    options.syntax = syntax;
    options.mode = ERM_dataset;
    const OFCondition condition = parseDicom(stream, file, options);
    if (condition.bad())
        return condition;
    return file.getDataset()->findAndDeleteElement(DCM_DataSetTrailingPadding);
}

/// Passes over the meta header; the syntax that it declares, EXS_Unknown when there is none that can be used.
E_TransferSyntax passMetaHeader(const QByteArray& bytes, qint64& at)
{
    if (bytes.mid(kPreamble, 4) != "DICM")
        return EXS_Unknown;
    // The meta header is written so in every file, whatever it declares of the dataset.
    const ElementScan scan(bytes, DcmXfer(EXS_LittleEndianExplicit));
    QByteArray uid;
    ElementScan::Element element;
    for (at = kPreamble + 4; scan.find(at, element) && element.key.getGroup() == 0x0002; at = element.end) {
        if (element.end < 0)
            return EXS_Unknown;
        if (element.key == DCM_TransferSyntaxUID)
            // Up to the zero byte by which UIDs are padded.
            uid =
                QByteArray(
                    bytes.mid(static_cast<int>(element.value), static_cast<int>(element.end - element.value))
                        .constData())
                    .trimmed();
    }
    const DcmXfer syntax(uid.constData());
    return syntax.getStreamCompression() == ESC_none ? syntax.getXfer() : EXS_Unknown;
}

/// The bytes of all frames, when the dataset says so without doubt; 0 else.
qint64 frameBytes(DcmItem& dataset)
{
    Uint16 rows = 0;
    Uint16 columns = 0;
    Uint16 samples = 0;
    Uint16 bits = 0;
    Sint32 frames = 1;
    if (dataset.findAndGetUint16(DCM_Rows, rows).bad() ||
        dataset.findAndGetUint16(DCM_Columns, columns).bad() ||
        dataset.findAndGetUint16(DCM_SamplesPerPixel, samples).bad() ||
        dataset.findAndGetUint16(DCM_BitsAllocated, bits).bad() || bits % 8 != 0)
        return 0;
    if (dataset.findAndGetSint32(DCM_NumberOfFrames, frames).bad())
        frames = 1;
    // In floating point, where no product of claimed numbers wraps.
    const double size = double(rows) * columns * samples * (bits / 8) * frames;
    return size > 0 && size <= double(kMaxFileBytes) ? static_cast<qint64>(size) : 0;
}

bool namesItself(DcmItem& dataset)
{
    return dataset.tagExistsWithValue(DCM_StudyInstanceUID) &&
           dataset.tagExistsWithValue(DCM_SeriesInstanceUID) &&
           dataset.tagExistsWithValue(DCM_SOPInstanceUID);
}

/// Picks the sound elements of one dataset.
class Salvage
{
public:
    Salvage(const QByteArray& bytes, E_TransferSyntax syntax)
        : mBytes(bytes)
        , mSyntax(syntax)
        , mScan(bytes, DcmXfer(syntax))
    {
    }

    OFCondition read(qint64 at, DcmFileFormat& file)
    {
        while (at < mBytes.size())
            at = takeElement(at);
        // Last, because the number of bytes that the frames need stands in other elements.
        if (mNativePixels.end > 0)
            takeNativePixels();
        // All together once more: what is sound alone must also be so side by side.
        return parse(mSound, mSyntax, file);
    }

    QString leftOut() const
    {
        QStringList told = mLeftOut.mid(0, kNamesToTell);
        if (mLeftOut.size() > kNamesToTell)
            told.append(QStringLiteral("%1 more").arg(mLeftOut.size() - kNamesToTell));
        return told.join(QLatin1String(", "));
    }

private:
    using Element = ElementScan::Element;

    /// Where to go on.
    qint64 takeElement(qint64 at)
    {
        Element element;
        const bool isElement = mScan.find(at, element);
        if (isElement && element.key == DCM_DataSetTrailingPadding)
            return mBytes.size();
        if (!isElement || !canFollow(element.key))
            return leaveOutFrom(at, QStringLiteral("what follows"));
        const QString name = QString::fromStdString(element.key.toString());
        const bool isCompressed = DcmXfer(mSyntax).isEncapsulated() && element.key == DCM_PixelData;
        if (element.end < 0 && isCompressed && element.isOpen)
            return takeWholeFragments(at, element);
        if (element.end < 0)
            return leaveOutFrom(at, name + QStringLiteral(" and what follows"));
        if (isCompressed && !element.isOpen)
            mNativePixels = {element.key, false, at, element.end};
        else if (mKeys.count(element.key) > 0 || !take(slice(at, element.end)))
            mLeftOut.append(name);
        mKeys.insert(element.key);
        return element.end;
    }

    /// Groups that no dataset has come from bytes that are none.
    static bool canFollow(const DcmTagKey& key) { return key.getGroup() > 0x0002 && key.getGroup() < 0xfffc; }

    qint64 leaveOutFrom(qint64 at, const QString& what)
    {
        mLeftOut.append(QStringLiteral("%1 from byte %2 on").arg(what).arg(at));
        return mBytes.size();
    }

    QByteArray slice(qint64 begin, qint64 end) const
    {
        return QByteArray::fromRawData(mBytes.constData() + begin, static_cast<int>(end - begin));
    }

    bool take(const QByteArray& element)
    {
        DcmFileFormat alone;
        // Exactly one must come of it: damage inside may read as several.
        if (parse(element, mSyntax, alone).bad() || alone.getDataset()->card() != 1)
            return false;
        mSound.append(element);
        return true;
    }

    qint64 takeWholeFragments(qint64 at, const Element& element)
    {
        int items = 0;
        const qint64 end = mScan.endOfWholeItems(element.value, items);
        // The first item is the table of offsets. The slice gets an end of its own, for the file's is what is missing.
        if (items < 2 || !take(slice(at, end) + kSequenceEnd))
            return leaveOutFrom(at, QString::fromStdString(element.key.toString()));
        return leaveOutFrom(
            end, QStringLiteral("the end of %1").arg(QString::fromStdString(element.key.toString())));
    }

    /// All compressed syntaxes write everything but Pixel Data as the uncompressed one does that is named here.
    void takeNativePixels()
    {
        DcmFileFormat others;
        const QByteArray pixels = slice(mNativePixels.value, mNativePixels.end);
        Element element;
        ElementScan(mBytes, DcmXfer(EXS_LittleEndianExplicit)).find(mNativePixels.value, element);
        const qint64 size = element.end - element.value;
        const E_TransferSyntax declared = std::exchange(mSyntax, EXS_LittleEndianExplicit);
        const qint64 expected = parse(mSound, mSyntax, others).good() ? frameBytes(*others.getDataset()) : 0;
        // Values have an even length.
        const bool isSized = expected > 0 && size == expected + expected % 2;
        if (isSized && take(pixels)) {
            mLeftOut.append(QStringLiteral("the declared compression"));
            return;
        }
        mSyntax = declared;
        mLeftOut.append(QString::fromStdString(mNativePixels.key.toString()));
    }

    const QByteArray& mBytes;
    E_TransferSyntax mSyntax;
    ElementScan mScan;
    std::set<DcmTagKey> mKeys;
    QByteArray mSound;
    Element mNativePixels;  // uncompressed where compressed ones are declared; `value` is where it begins
    QStringList mLeftOut;
};

}  // namespace

OFCondition readDamagedDicomFile(const char* path, DcmFileFormat& file, QString& leftOut)
{
    leftOut.clear();
    const OFCondition strict = readDicomFile(path, file);
    QByteArray bytes;
    qint64 at = 0;
    // What nests too deep is refused here as well: salvage must be no way round a bound.
    if (strict.good() || strict == EC_NestedTooDeep || !readWhole(path, bytes))
        return strict;
    const E_TransferSyntax syntax = passMetaHeader(bytes, at);
    if (syntax == EXS_Unknown)
        return strict;
    Salvage salvage(bytes, syntax);
    if (salvage.read(at, file).bad() || !namesItself(*file.getDataset()))
        return strict;
    leftOut = salvage.leftOut();
    return EC_Normal;
}

OFCondition readAsRegistered(const char* path, DcmFileFormat& file, const OFCondition& strict)
{
    // Only for a file that failed is the database asked; sound ones cost it no question.
    if (!Kxg::IsDamagedFile(path))
        return strict;
    QString leftOut;
    const OFCondition condition = readDamagedDicomFile(path, file, leftOut);
    if (condition.good())
        LogFile::warnf("%s is damaged (%s): left out %s", path, strict.text(), qUtf8Printable(leftOut));
    return condition;
}

}  // namespace Kdd
