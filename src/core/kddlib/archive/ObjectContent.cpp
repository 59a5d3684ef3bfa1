#include "kddlib/archive/ObjectContent.h"

#include "platform/os/RandomAccessFile.h"

#include <QtEndian>

#include <dcmtk/dcmdata/dctk.h>

#include <cstring>

namespace Kdd
{

namespace
{

constexpr int kPreamble = 128;
constexpr qint64 kBlock = 256 * 1024;

// Preamble, prefix, and the first attribute, which tells the length of those after it: (0002,0000) UL.
constexpr int kMetaBegin = kPreamble + 4 + 12;
constexpr char kMetaLength[] = {2, 0, 0, 0, 'U', 'L', 4, 0};

QByteArray textOf(DcmMetaInfo& meta, const DcmTagKey& key)
{
    OFString text;
    meta.findAndGetOFString(key, text);
    return QByteArray(text.c_str(), static_cast<int>(text.size()));
}

/// Whether the rest of both files is the same.
bool isSameRest(const RandomAccessFile& one, qint64 at, const RandomAccessFile& other, qint64 otherAt)
{
    if (one.size() - at != other.size() - otherAt)
        return false;
    QByteArray bytes(kBlock, 0);
    QByteArray otherBytes(kBlock, 0);
    for (; at < one.size(); at += kBlock, otherAt += kBlock) {
        const qint64 count = qMin(kBlock, one.size() - at);
        if (one.readAt(at, bytes.data(), count) != count ||
            other.readAt(otherAt, otherBytes.data(), count) != count ||
            std::memcmp(bytes.constData(), otherBytes.constData(), static_cast<std::size_t>(count)) != 0)
            return false;
    }
    return true;
}

}  // namespace

Result findDataset(const QByteArray& path, qint64& offset)
{
    RandomAccessFile file;
    const Result opened = file.open(path.constData());
    if (opened.bad())
        return opened;
    char begin[kMetaBegin] = {};
    if (file.readAt(0, begin, kMetaBegin) != kMetaBegin || std::memcmp(begin + kPreamble, "DICM", 4) != 0)
        return Result::failure(
            QStringLiteral("It is no DICOM file: it does not begin with the DICOM prefix"));
    const char* length = begin + kPreamble + 4;
    if (std::memcmp(length, kMetaLength, sizeof kMetaLength) != 0)
        return Result::failure(QStringLiteral("Its meta information does not tell its length"));
    offset = kMetaBegin + qint64(qFromLittleEndian<quint32>(length + sizeof kMetaLength));
    if (offset >= file.size())
        return Result::failure(QStringLiteral("It ends within its meta information"));
    return {};
}

Result readMeta(const QByteArray& path, ObjectMeta& meta)
{
    qint64 offset = 0;
    const Result found = findDataset(path, offset);
    if (found.bad())
        return found;
    DcmFileFormat format;
    const OFCondition read =
        format.loadFile(path.constData(), EXS_Unknown, EGL_noChange, DCM_MaxReadLength, ERM_metaOnly);
    if (read.bad())
        return Result::failure(QString::fromLatin1(read.text()));
    DcmMetaInfo& info = *format.getMetaInfo();
    meta = {textOf(info, DCM_MediaStorageSOPClassUID), textOf(info, DCM_MediaStorageSOPInstanceUID),
            textOf(info, DCM_TransferSyntaxUID)};
    return {};
}

bool isSameObject(const QByteArray& path, const QByteArray& other)
{
    RandomAccessFile one;
    RandomAccessFile two;
    if (one.open(path.constData()).bad() || two.open(other.constData()).bad())
        return false;
    if (one.size() == two.size() && isSameRest(one, 0, two, 0))
        return true;
    ObjectMeta meta;
    ObjectMeta otherMeta;
    qint64 offset = 0;
    qint64 otherOffset = 0;
    return readMeta(path, meta).good() && readMeta(other, otherMeta).good() &&
           meta.transferSyntaxUID == otherMeta.transferSyntaxUID && findDataset(path, offset).good() &&
           findDataset(other, otherOffset).good() && isSameRest(one, offset, two, otherOffset);
}

}  // namespace Kdd
