#include "kddlib/Limits.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagfile/format/TagFileFrame.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/KxMsg.h"
#include "platform/base/LogFile.h"
#include "platform/base/Stopwatch.h"
#include "platform/compression/LzmaCompress.h"
#include "platform/compression/QxCompress.h"

#include <QDataStream>
#include <QSet>

#include <limits>

namespace Kdd
{

namespace
{

constexpr int kBodyReservation = 0x20000;
constexpr qint64 kMaxFile = std::numeric_limits<int>::max() - 64;  // what one byte array holds

const char* const kTooLarge = "Tag file would be larger than the format allows";
const char* const kTooManyVolumeImages = "Tag file would hold volumes of more images than the format allows";
const char* const kNotCompressed = "Tag file could not be compressed";

QByteArray compressed(const QByteArray& body, TagFile::CompressionMode mode)
{
    switch (mode) {
    case TagFile::CompressionMode::Zlib:
        return qxCompress(reinterpret_cast<const unsigned char*>(body.constData()), body.size());
    case TagFile::CompressionMode::Lzma:
        return lzmaCompress(body);
    case TagFile::CompressionMode::None:
        break;
    }
    return body;
}

qint64 totalSize(const QList<QByteArray>& blobs)
{
    qint64 total = 0;
    for (const QByteArray& blob : blobs)
        total += blob.size();
    return total;
}

/// All of a file but its body.
qint64 sizeAround(const QList<QByteArray>& blobs)
{
    return kFrameSize + qint64(kBlobFrameSize) * blobs.size() + totalSize(blobs);
}

int asInt(qint64 value)
{
    return static_cast<int>(qMin<qint64>(value, std::numeric_limits<int>::max()));
}

}  // namespace

/// Makes the records of a study's tree, and refuses a tree of which its reader would lose something: whatever the
/// reader does not take must not reach the file that is there.
class TagFile::BodyWriter
{
public:
    explicit BodyWriter(const TagFile& file)
        : mFile(file)
    {
        mBody.reserve(kBodyReservation);
    }

    /// False, with the reason in `refusal`, when the study must not be written.
    bool write(const QByteArray& uid, const TagMap& study)
    {
        if (study.uid(TagMap::StudyLevel) != uid)
            return refuse(QStringLiteral("Tag file of study %1 would hold study %2")
                              .arg(QString::fromLatin1(uid), nameOf(study.uid(TagMap::StudyLevel))));
        bool isWritten = writeNode(kStudyRecord, study);
        for (auto series = study.children().begin(); series != study.children().end() && isWritten; ++series)
            isWritten = writeSeries(**series);
        return isWritten;
    }

    const QByteArray& body() const { return mBody.bytes(); }
    const QList<QByteArray>& blobs() const { return mBlobs; }
    int volumes() const { return mVolumes; }
    const QString& refusal() const { return mRefusal; }

private:
    static QString nameOf(const QByteArray& uid)
    {
        return uid.isEmpty() ? QStringLiteral("without UID") : QString::fromLatin1(uid);
    }

    bool refuse(const QString& reason)
    {
        mRefusal = reason;
        return false;
    }

    bool writeNode(quint8 marker, const TagMap& node)
    {
        mBody << marker;
        node.serialize(mBody, mContext);
        return !mBody.failed() || refuse(QLatin1String(mContext.refusal));
    }

    bool writeSeries(const TagMap& series)
    {
        const QByteArray uid = series.uid(TagMap::SeriesLevel);
        if (mSeries.contains(uid))
            return refuse(QStringLiteral("Tag file would hold series %1 twice").arg(nameOf(uid)));
        mSeries.insert(uid);
        bool isWritten = writeNode(kSeriesRecord, series);
        for (auto image = series.children().begin(); image != series.children().end() && isWritten; ++image)
            isWritten = checkImage(**image) && writeNode(kImageRecord, **image);
        return isWritten && (series.volumes().isEmpty() || writeVolumes(series));
    }

    /// Nearly every image stands in the index, which knows each name once. Others may have been renamed in the tree.
    bool checkImage(const TagMap& image)
    {
        const QByteArray key = imageKey(image);
        if (mFile.mImages.find(key) == &image)
            return true;
        if (mFile.mImages.find(key) != nullptr || mRenamed.contains(key))
            return refuse(QStringLiteral("Tag file would hold image %1 twice").arg(nameOf(key)));
        mRenamed.insert(key);
        return true;
    }

    bool writeVolumes(const TagMap& series)
    {
        mBody << kVolumesRecord;
        series.serializeVolumes(mBody, mBlobs);
        mVolumes += series.volumes().size();
        return !mBody.failed() || refuse(QLatin1String(kTooManyVolumeImages));
    }

    const TagFile& mFile;
    KxMsg mBody;
    QList<QByteArray> mBlobs;
    TagMap::WriteContext mContext{mBlobs, kMaxElements, 0, nullptr};
    QSet<QByteArray> mSeries;
    QSet<QByteArray> mRenamed;
    int mVolumes = 0;
    QString mRefusal;
};

bool TagFile::writeCacheFile(QDataStream& out)
{
    if (write(out, sCompressionMode))
        return true;
    LogFile::errorf("%s", qUtf8Printable(mFailure));
    return false;
}

bool TagFile::write(QDataStream& out, CompressionMode mode)
{
    const Stopwatch stopwatch;
    BodyWriter writer(*this);
    for (auto study = mStudies.cbegin(); study != mStudies.cend(); ++study) {
        for (TagMap* series : study.value()->children()) {
            const QString reason = settleVolumes(*series);
            if (!reason.isEmpty())
                return fail(reason);
        }
        study.value()->relinkItems();
        if (!writer.write(study.key(), *study.value()))
            return fail(writer.refusal());
    }
    const QByteArray& body = writer.body();
    const QList<QByteArray>& blobs = writer.blobs();
    if (body.size() > kMaxBodySize || sizeAround(blobs) + body.size() > kMaxFile)
        return fail(QLatin1String(kTooLarge));
    const QByteArray stored = compressed(body, mode);
    if (stored.isEmpty() && !body.isEmpty())
        return fail(QLatin1String(kNotCompressed));
    out.writeRawData(kMagic, sizeof kMagic);
    out << kVersion << quint8(0) << kLayout << static_cast<quint8>(mode);
    out << static_cast<qint32>(stored.size());
    out.writeRawData(stored.constData(), stored.size());
    out << static_cast<qint32>(blobs.size());
    for (const QByteArray& blob : blobs)
        out << blob;
    recordSizes(stored.size(), body.size(), blobs);
    mStatistics.volumes = writer.volumes();
    mStatistics.writeMs = stopwatch.elapsed();
    return true;
}

void TagFile::recordSizes(qint64 storedBody, qint64 body, const QList<QByteArray>& blobs)
{
    const qint64 around = sizeAround(blobs);
    mStatistics.blobs = blobs.size();
    mStatistics.blobBytes = asInt(totalSize(blobs));
    mStatistics.storedSize = asInt(storedBody + around);
    mStatistics.uncompressedSize = asInt(body + around);
}

QByteArray TagFile::serialized(CompressionMode mode)
{
    QByteArray content;
    QDataStream out(&content, QIODevice::WriteOnly);
    return write(out, mode) ? content : QByteArray();
}

}  // namespace Kdd
