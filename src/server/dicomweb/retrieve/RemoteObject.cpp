#include "server/dicomweb/retrieve/RemoteObject.h"

#include <kddlib/KxCurlClient.h>
#include <kddlib/KxCurlDownloadStream.h>
#include <kddlib/KxHttpStatus.h>

#include <cstring>
#include <exception>

namespace Kdd::DicomWeb
{

namespace
{

constexpr qint64 kWindow = 128 * 1024;  // so that most headers take one request [bytes]
constexpr qint64 kBlock = 128 * 1024;

std::string rangeText(qint64 offset, qint64 length)
{
    return std::to_string(offset) + '-' + std::to_string(offset + length - 1);
}

Result refused(KxCurlDownloadStream& stream)
{
    return Result::failure(QStringLiteral("The storage server: ") +
                           QString::fromStdString(stream.httpStatus().reason()));
}

/// Whether the stream brings the range of the version.
Result check(KxCurlDownloadStream& stream, const ObjectVersion& version, qint64 size)
{
    const KxHttpStatus& status = stream.httpStatus();
    if (!status.ok())
        return refused(stream);
    if (status.code != 206 || stream.contentLength() != size || ObjectVersion::of(status) != version)
        return Result::failure(QStringLiteral("The object has changed on the storage server"));
    return {};
}

/// Fetches a range block by block.
class RemoteProducer : public Http::Producer
{
public:
    RemoteProducer(std::string url, ObjectVersion version, qint64 size, const FileStretch& stretch)
        : mUrl(std::move(url))
        , mVersion(std::move(version))
        , mSize(size)
        , mStretch(stretch)
    {
    }

    Result next(QByteArray& block) override
    try {
        block.clear();
        if (mStretch.length == 0)
            return {};
        if (mStream == nullptr) {
            mStream = std::make_unique<KxCurlDownloadStream>(
                KxCurlClient::instance().readRange(mUrl, rangeText(mStretch.offset, mStretch.length), false));
            const Result answered = check(*mStream, mVersion, mSize);
            if (answered.bad())
                return answered;
        }
        block.resize(static_cast<int>(qMin(kBlock, mStretch.length)));
        mStream->read(block.data(), block.size());
        if (mStream->gcount() != block.size())
            return Result::failure(QStringLiteral("The storage server broke off"));
        mStretch.length -= block.size();
        return {};
    } catch (const std::exception& fault) {
        return Result::failure(QString::fromLocal8Bit(fault.what()));
    }

private:
    std::string mUrl;
    ObjectVersion mVersion;
    qint64 mSize;
    FileStretch mStretch;
    std::unique_ptr<KxCurlDownloadStream> mStream;
};

}  // namespace

std::unique_ptr<RemoteObject> RemoteObject::open(const QByteArray& url, Result& result)
try {
    std::unique_ptr<RemoteObject> object(new RemoteObject);
    object->mUrl = url.toStdString();
    KxCurlDownloadStream stream =
        KxCurlClient::instance().readRange(object->mUrl, rangeText(0, kWindow), false);
    if (!stream.httpStatus().ok()) {
        result = refused(stream);
        return nullptr;
    }
    object->mSize = stream.contentLength();
    object->mVersion = ObjectVersion::of(stream.httpStatus());
    object->mWindow.resize(static_cast<int>(qMin(kWindow, object->mSize)));
    stream.read(object->mWindow.data(), object->mWindow.size());
    if (object->mSize == 0 || stream.gcount() != object->mWindow.size()) {
        result = Result::failure(QStringLiteral("The storage server does not tell how long the object is"));
        return nullptr;
    }
    return object;
} catch (const std::exception& fault) {
    result = Result::failure(QString::fromLocal8Bit(fault.what()));
    return nullptr;
}

qint64 RemoteObject::read(qint64 offset, char* out, qint64 length)
{
    if (offset < 0 || length < 0)
        return -1;
    length = qMin(length, mSize - offset);
    if (length <= 0)
        return 0;
    const bool isHere = offset >= mStart && offset < mStart + mWindow.size();
    if (!isHere) {
        RemoteProducer producer(mUrl, mVersion, mSize, {offset, qMin(qMax(length, kWindow), mSize - offset)});
        if (producer.next(mWindow).bad())
            mWindow.clear();
        mStart = offset;
    }
    const qint64 count = qMin(length, mStart + mWindow.size() - offset);
    if (count <= 0)
        return -1;
    std::memcpy(out, mWindow.constData() + (offset - mStart), static_cast<size_t>(count));
    return count;
}

/// What was not told apart may be another object under each request.
QByteArray RemoteObject::identity() const
{
    if (!mVersion.isKnown())
        return {};
    const std::string version =
        mVersion.entityTag + '\n' + mVersion.generation + '\n' + mVersion.lastModified;
    return QByteArray::number(mSize) + '\n' + QByteArray::fromStdString(version);
}

Http::BodyPart RemoteObject::part(const FileStretch& stretch) const
{
    return std::make_unique<RemoteProducer>(mUrl, mVersion, mSize, stretch);
}

}  // namespace Kdd::DicomWeb
