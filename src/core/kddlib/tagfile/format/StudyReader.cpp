#include "kddlib/tagfile/format/StudyReader.h"

#include "kddlib/Limits.h"
#include "kddlib/tagfile/StudyTree.h"
#include "kddlib/tagfile/TagFileSettings.h"
#include "kddlib/tagfile/format/StudyBody.h"
#include "kddlib/tagfile/format/TagFileFrame.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/KxMsg.h"
#include "platform/base/LogFile.h"
#include "platform/compression/LzmaCompress.h"
#include "platform/compression/QxCompress.h"

#include <QDataStream>

#include <cstring>

namespace Kdd
{

namespace
{

constexpr int kReadChunk = 0x40000;
// Each question to an encoded node goes through its elements one by one.
constexpr int kMaxEncodedElements = 500;
constexpr qint64 kMaxStoredBody = kMaxBodySize + kReadChunk;  // data that cannot be compressed grows a little

const char* const kIncorrectHeader = "Tag file has incorrect header";
const char* const kUnsupportedVersion = "Tag file has unsupported version";
const char* const kTruncated = "Tag file seems to be truncated";
const char* const kUnsupportedCompression = "Tag file has unsupported compression format";
const char* const kDamaged = "Tag file has a damaged body";
const char* const kNoStudy = "Tag file holds no readable study";

struct Header
{
    char magic[4] = {};
    quint8 version = 0;
    quint8 reserved = 0;
    quint8 layout = 0;
    quint8 compression = 0;
};

/// At most `wanted` bytes. Memory grows with what really arrives: the wanted count may be a lie.
QByteArray readAtMost(QDataStream& in, qint64 wanted)
{
    QByteArray bytes;
    while (bytes.size() < wanted) {
        const int had = bytes.size();
        const int chunk = static_cast<int>(qMin<qint64>(kReadChunk, wanted - had));
        bytes.resize(had + chunk);
        const int got = in.readRawData(bytes.data() + had, chunk);
        bytes.resize(had + qMax(0, got));
        if (got < chunk)
            break;
    }
    return bytes;
}

QList<QByteArray> readBlobs(QDataStream& in, qint32& count)
{
    count = 0;
    in >> count;
    // A table that ends early is accepted: what is missing are pictures, which can be made again.
    QList<QByteArray> blobs;
    for (qint32 i = 0; i < count && !in.atEnd(); ++i) {
        QByteArray blob;
        in >> blob;
        if (in.status() != QDataStream::Ok)
            break;
        blobs.append(blob);
    }
    return blobs;
}

/// False when the mode is none of ours; damage gives an empty body.
bool uncompress(const QByteArray& stored, quint8 mode, QByteArray& body)
{
    // The bound goes along: a few bytes may claim to become gigabytes.
    switch (static_cast<TagFileSettings::CompressionMode>(mode)) {
    case TagFileSettings::CompressionMode::None:
        body = stored;
        return true;
    case TagFileSettings::CompressionMode::Zlib:
        body = qxUncompress(stored, kMaxBodySize);
        return true;
    case TagFileSettings::CompressionMode::Lzma:
        body = lzmaUncompress(stored, kMaxBodySize);
        return true;
    }
    return false;
}

Result refuse(const char* reason)
{
    LogFile::errorf("%s", reason);
    return Result::failure(QLatin1String(reason));
}

}  // namespace

/// Puts the records of a body into the indexes and the tree of a study.
class StudyBodyReader
{
public:
    StudyBodyReader(StudyTree& tree, const char* studyUID, const QList<QByteArray>& blobs)
        : mTree(tree)
        , mWanted(studyUID)
        , mContext{blobs, kMaxElements, 0}
    {
    }

    /// False when the body is damaged.
    bool read(const QByteArray& bytes)
    {
        mBody = new StudyBody(bytes);
        KxMsg body(bytes);
        while (body.remaining() > 0 && !body.failed()) {
            quint8 marker = 0;
            body >> marker;
            mPlace = bytes.size() - body.remaining();
            const int length = TagMap::readLength(body);
            KxMsg record = body.readMessage(length);
            if (body.failed() || !take(marker, record))
                return false;
        }
        return !body.failed();
    }

    int volumes() const { return mVolumes; }

private:
    bool take(quint8 marker, KxMsg& record)
    {
        switch (marker) {
        case kStudyRecord:
            return takeStudy(record);
        case kSeriesRecord:
            return mStudy == nullptr || takeSeries(record);
        case kImageRecord:
            return mSeries == nullptr || takeImage(record);
        case kVolumesRecord:
            return mSeries == nullptr || takeVolumes(record);
        default:
            return true;  // what a later release may write has a length, too
        }
    }

    /// Without a current study all that follows is passed over until the next one.
    bool takeStudy(KxMsg& record)
    {
        mStudy = nullptr;
        mSeries = nullptr;
        if (!mTree.isEmpty())
            return true;
        auto study = std::make_shared<TagMap>();
        study->deserialize(record, nullptr, mContext);
        const QByteArray uid = study->uid(TagMap::StudyLevel);
        // Another study is no damage; a record that cannot be read is, whoever it is of.
        if (record.failed() || (mWanted != nullptr && uid != mWanted))
            return !record.failed();
        mStudy = study.get();
        mTree.enterStudy(uid, study);
        return true;
    }

    bool takeSeries(KxMsg& record)
    {
        mSeries = readBelow(record, mStudy);
        const QByteArray uid = mSeries->uid(TagMap::SeriesLevel);
        // Two series of one UID are no tree that was ever written.
        if (record.failed() || mTree.series().contains(uid))
            return false;
        mTree.enterSeries(uid, mSeries);
        return true;
    }

    bool takeImage(KxMsg& record)
    {
        TagMap* image = readImage(record);
        const QByteArray key = StudyTree::imageKey(*image);
        // No file of ours holds an image twice; in a hostile one each would be searched for among its siblings.
        TagMap* replaced = mTree.imageUnder(key);
        if (replaced != nullptr && ++mReplacedImages > kMaxReplacedImages)
            return false;
        delete replaced;
        mTree.enterImage(key, image);
        return !record.failed();
    }

    bool takeVolumes(KxMsg& record)
    {
        mSeries->deserializeVolumes(record, mContext.blobs);
        mVolumes += mSeries->volumes().size();
        return !record.failed();
    }

    TagMap* readBelow(KxMsg& record, TagMap* parent)
    {
        // Hung up before it is read: the tree then owns it, also when the record proves damaged.
        auto* node = new TagMap;
        parent->appendChild(node);
        node->deserialize(record, parent, mContext);
        return node;
    }

    /// Most images are never looked into, so each stays as it is in the body where that makes no difference to anybody.
    TagMap* readImage(KxMsg& record)
    {
        const int elements =
            mBody->countPlain(mPlace, *mSeries, qMin(mContext.elementsLeft, kMaxEncodedElements));
        if (elements == 0)
            return readBelow(record, mSeries);
        mContext.elementsLeft -= elements;
        auto* node = new TagMap;
        mSeries->appendChild(node);
        node->keepEncoded(*mBody, mPlace);
        return node;
    }

    StudyTree& mTree;
    const char* mWanted;
    QExplicitlySharedDataPointer<const StudyBody> mBody;
    int mPlace = 0;  // of the present record's elements in the body
    TagMap::RecordContext mContext;
    TagMap* mStudy = nullptr;
    TagMap* mSeries = nullptr;
    int mReplacedImages = 0;
    int mVolumes = 0;
};

Result readStudy(QDataStream& in, const StudyRequest& request, StudyTree& tree, FileSizes& sizes)
{
    Header header;
    if (in.readRawData(header.magic, sizeof header.magic) != int(sizeof header.magic) ||
        std::memcmp(header.magic, kMagic, sizeof kMagic) != 0)
        return refuse(kIncorrectHeader);
    in >> header.version >> header.reserved >> header.layout >> header.compression;
    if (header.version != kVersion)
        return refuse(kUnsupportedVersion);
    QByteArray stored;
    QList<QByteArray> blobs;
    qint32 promised = 0;
    // Without a length of its own the old body runs to the end of the file.
    if (header.layout == kOldLayout) {
        stored = readAtMost(in, kMaxStoredBody);
    } else {
        qint32 size = 0;
        in >> size;
        stored = readAtMost(in, qMin<qint64>(size, kMaxStoredBody));
        // A size beyond the bound gets fewer bytes than it asks for, and so counts as cut off.
        if (in.status() != QDataStream::Ok || size < 0 || stored.size() < size)
            return refuse(kTruncated);
        blobs = readBlobs(in, promised);
    }
    QByteArray body;
    if (!uncompress(stored, header.compression, body))
        return refuse(kUnsupportedCompression);
    recordSizes(stored.size(), body.size(), blobs, sizes);
    sizes.missingBlobs = qMax(0, promised - blobs.size());
    if (sizes.missingBlobs > 0 && LogFile::debugLogging())
        LogFile::printf("%s ends early: %d of %d previews are missing", qUtf8Printable(request.name),
                        sizes.missingBlobs, promised);
    StudyBodyReader reader(tree, request.studyUID, blobs);
    if (body.size() > kMaxBodySize || !reader.read(body)) {
        // Half a study must not be taken for a whole one and written back.
        tree.clear();
        sizes = {};
        return refuse(kDamaged);
    }
    sizes.volumes = reader.volumes();
    return tree.isEmpty() ? Result::failure(QLatin1String(kNoStudy)) : Result();
}

}  // namespace Kdd
