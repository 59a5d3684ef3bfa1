#include "kddlib/items/RegularFile.h"

#include "kddlib/net/dicom/KxDcmFileLoader.h"
#include "platform/os/FileStatus.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcfilefo.h>
#include <dcmtk/dcmdata/dcostrmb.h>
#include <dcmtk/dcmdata/dcpixel.h>
#include <dcmtk/dcmdata/dcwcache.h>

#include <algorithm>
#include <vector>

namespace Kdd
{

namespace
{

constexpr qint64 kMaxBytes = qint64(512) * 1024 * 1024;
constexpr int kBlock = 256 * 1024;

/// Wide pixels come as words: the order within a word is the machine's by now, that of the words is still the file's.
OFCondition orderWords(DcmDataset& dataset)
{
    Uint16 bits = 0;
    DcmElement* pixels = nullptr;
    if (dataset.findAndGetUint16(DCM_BitsAllocated, bits).bad() || bits != 32 ||
        dataset.findAndGetElement(DCM_PixelData, pixels).bad() || pixels->getVR() != EVR_OW)
        return EC_Normal;
    Uint16* words = nullptr;
    const OFCondition condition = pixels->getUint16Array(words);
    for (Uint32 i = 0; condition.good() && words != nullptr && i + 1 < pixels->getLengthField() / 2; i += 2)
        std::swap(words[i], words[i + 1]);
    return condition;
}

Result writeBytes(DcmFileFormat& file, E_TransferSyntax xfer, QByteArray& bytes)
{
    std::vector<char> block(kBlock);
    DcmOutputBufferStream out(block.data(), kBlock);
    DcmWriteCache cache;
    QByteArray written;
    OFCondition condition = file.validateMetaInfo(xfer, EWM_updateMeta);
    if (condition.bad())
        return Result::failure(QString::fromLatin1(condition.text()));
    file.transferInit();
    do {
        condition = file.write(out, xfer, EET_UndefinedLength, &cache, EGL_withoutGL);
        void* from = nullptr;
        offile_off_t length = 0;
        out.flushBuffer(from, length);
        written.append(static_cast<const char*>(from), static_cast<int>(length));
    } while (condition == EC_StreamNotifyClient && written.size() <= kMaxBytes);
    file.transferEnd();
    if (condition.bad())
        return Result::failure(QString::fromLatin1(condition.text()));
    bytes = written;
    return {};
}

}  // namespace

Result readAsRegularFile(const QByteArray& path, QByteArray& bytes)
{
    FileStatus status;
    if (statusOf(path.constData(), status) && status.size > kMaxBytes)
        return Result::failure(
            QStringLiteral("The file is of an unusual form and too large to be converted"));
    DcmFileFormat file;
    OFCondition condition = loadDicomFile(path.constData(), file);
    DcmDataset* dataset = file.getDataset();
    E_TransferSyntax syntax = dataset->getOriginalXfer();
    const bool isBigEndian = syntax == EXS_BigEndianExplicit;
    if (condition.good() && isBigEndian)
        condition = orderWords(*dataset);
    if (condition.bad())
        return Result::failure(QStringLiteral("The DICOM file cannot be read: ") +
                               QString::fromLatin1(condition.text()));
    if (!DcmXfer(syntax).isEncapsulated() && syntax != EXS_LittleEndianImplicit)
        syntax = EXS_LittleEndianExplicit;
    return writeBytes(file, syntax, bytes);
}

}  // namespace Kdd
