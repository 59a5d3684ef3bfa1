#include "kddlib/tagfile/format/StudyWriter.h"

#include "kddlib/Limits.h"
#include "kddlib/tagfile/StudyTree.h"
#include "kddlib/tagfile/format/TagFileFrame.h"
#include "kddlib/tagfile/format/VolumeSettling.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/KxMsg.h"
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

QByteArray compressed(const QByteArray& body, TagFileSettings::CompressionMode mode)
{
    switch (mode) {
    case TagFileSettings::CompressionMode::Zlib:
        return qxCompress(reinterpret_cast<const unsigned char*>(body.constData()), body.size());
    case TagFileSettings::CompressionMode::Lzma:
        return lzmaCompress(body);
    case TagFileSettings::CompressionMode::None:
        break;
    }
    return body;
}

}  // namespace

/// Makes the records of a study's tree, and refuses a tree of which its reader would lose something: whatever the
/// reader does not take must not reach the file that is there.
class StudyBodyWriter
{
public:
    explicit StudyBodyWriter(const StudyTree& tree)
        : mTree(tree)
    {
        mBody.reserve(kBodyReservation);
    }

    /// Fails when the study must not be written.
    Result write(const QByteArray& uid, const TagMap& study)
    {
        // The file's place and its readers go by the UID of the index:
        // under another one nobody would find the study.
        if (study.uid(TagMap::StudyLevel) != uid)
            return Result::failure(QStringLiteral("Tag file of study %1 would hold study %2")
                                       .arg(QString::fromLatin1(uid), nameOf(study.uid(TagMap::StudyLevel))));
        bool isWritten = writeNode(kStudyRecord, study);
        for (auto series = study.children().begin(); series != study.children().end() && isWritten; ++series)
            isWritten = writeSeries(**series);
        return isWritten ? Result() : Result::failure(mRefusal);
    }

    const QByteArray& body() const { return mBody.bytes(); }
    const QList<QByteArray>& blobs() const { return mBlobs; }
    int volumes() const { return mVolumes; }

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
        const QByteArray key = StudyTree::imageKey(image);
        if (mTree.imageUnder(key) == &image)
            return true;
        if (mTree.imageUnder(key) != nullptr || mRenamed.contains(key))
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

    const StudyTree& mTree;
    KxMsg mBody;
    QList<QByteArray> mBlobs;
    TagMap::WriteContext mContext{mBlobs, kMaxElements, 0, nullptr};
    QSet<QByteArray> mSeries;
    QSet<QByteArray> mRenamed;
    int mVolumes = 0;
    QString mRefusal;
};

Result writeStudy(StudyTree& tree, TagFileSettings::CompressionMode mode, QDataStream& out, FileSizes& sizes)
{
    StudyBodyWriter writer(tree);
    for (auto study = tree.studies().cbegin(); study != tree.studies().cend(); ++study) {
        for (TagMap* series : study.value()->children()) {
            // Before the records are made, for it changes what the images say of their volumes.
            Result settled = VolumeSettling::settle(*series);
            if (settled.bad())
                return settled;
        }
        // An item inherits from the one at its place in the node above, as the reader will link them.
        study.value()->relinkItems();
        Result written = writer.write(study.key(), *study.value());
        if (written.bad())
            return written;
    }
    const QByteArray& body = writer.body();
    const QList<QByteArray>& blobs = writer.blobs();
    // The reader's bounds are those of the body before compression, so that is what is measured.
    if (body.size() > kMaxBodySize || sizeAround(blobs) + body.size() > kMaxFile)
        return Result::failure(QLatin1String(kTooLarge));
    const QByteArray stored = compressed(body, mode);
    // An empty text is how the compressors say that they failed.
    if (stored.isEmpty() && !body.isEmpty())
        return Result::failure(QLatin1String(kNotCompressed));
    // From here on nothing is refused: the first byte goes out only when the last one is known.
    out.writeRawData(kMagic, sizeof kMagic);
    out << kVersion << quint8(0) << kLayout << static_cast<quint8>(mode);
    out << static_cast<qint32>(stored.size());
    out.writeRawData(stored.constData(), stored.size());
    out << static_cast<qint32>(blobs.size());
    for (const QByteArray& blob : blobs)
        out << blob;
    recordSizes(stored.size(), body.size(), blobs, sizes);
    sizes.volumes = writer.volumes();
    return {};
}

}  // namespace Kdd
