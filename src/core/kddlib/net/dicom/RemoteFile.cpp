#include "kddlib/net/dicom/RemoteFile.h"

#include "kddlib/net/KxCurlClient.h"
#include "kddlib/net/http/HttpAnswer.h"
#include "kddlib/net/http/KxCurlDownloadStream.h"
#include "kddlib/net/http/WholeBody.h"

#include <QCryptographicHash>
#include <QtEndian>

#include <cstring>
#include <exception>

namespace Kdd
{

namespace
{

// Of the ranges behind the first. The bytes of 20 ms at 10 Gbit/s, beyond which a longer one spares nothing.
constexpr qint64 kFirstSpan = 32 * 1024;
constexpr qint64 kLongestSpan = 1024 * 1024;

// Of what is read of a stream at a time: parsers ask for a few bytes.
constexpr qint64 kStreamSpan = 16 * 1024;

// Of one range, so that a length in the data does not take memory before the bytes are there.
constexpr qint64 kMostAtOnce = 16 * 1024 * 1024;

// For what a parser steps back over.
constexpr int kHistory = 4 * 1024;

Result failure(const std::string& reason)
{
    return Result::failure(QString::fromStdString(reason));
}

Result changed()
{
    return Result::failure(QStringLiteral("The object has changed while it was read"));
}

/// Servers need not say it.
bool isSaidToBeEmpty(const KxHttpStatus& status)
{
    const std::string* const range = findHeader(status, "content-range");
    return range == nullptr || ContentRange::totalIn(*range) == "0";
}

KxCurlDownloadStream openRange(const std::string& url, qint64 offset, qint64 count)
{
    return KxCurlClient::instance().readRange(
        url, std::to_string(offset) + '-' + std::to_string(offset + count - 1), false);
}

Result readBody(KxCurlDownloadStream& stream, char* to, qint64 count)
{
    const bool isWhole = stream.read(to, count).gcount() == count;
    // Sees the end, with which the connection is free for the next request.
    stream.peek();
    if (isWhole && !stream.httpStatus().failed)
        return {};
    const std::string reason = stream.httpStatus().reason();
    return failure(reason.empty() ? "The server broke off" : reason);
}

}  // namespace

RemoteFile::RemoteFile(const QByteArray& url)
    : mUrl(url.toStdString())
    , mSpan(kFirstSpan)
{
}

RemoteFile::~RemoteFile() = default;

std::shared_ptr<RemoteFile> RemoteFile::open(const QByteArray& url, qint64 first, Result& result)
{
    std::shared_ptr<RemoteFile> file(new RemoteFile(url));
    try {
        result = file->begin(qBound<qint64>(1, first, kMostAtOnce));
    } catch (const std::exception& fault) {
        result = failure(fault.what());
    }
    return result.good() ? file : nullptr;
}

Result RemoteFile::begin(qint64 first)
{
    KxCurlDownloadStream stream = openRange(mUrl, 0, first);
    const KxHttpStatus status = stream.httpStatus();
    const std::optional<ContentRange> part = contentRangeOf(status);
    mVersion = ObjectVersion::of(status);
    // Of an object that is empty there is no first byte.
    if (status.code == kRangeNotSatisfiable && !status.failed && isSaidToBeEmpty(status))
        return {};
    // The whole object in place of the range, or a part of nobody knows how much.
    if (status.code == kOk || (status.ok() && part && part->total < 0)) {
        stream.close();
        return beginWhole();
    }
    if (!status.ok())
        return failure(status.reason());
    if (status.code != kPartialContent || !part)
        return Result::failure(QStringLiteral("The server does not say which range it sends"));
    mSize = part->total;
    mBytes.resize(static_cast<int>(part->range.length()));
    return readBody(stream, mBytes.data(), mBytes.size());
}

Result RemoteFile::beginWhole()
{
    mWhole = std::make_unique<KxCurlDownloadStream>(KxCurlClient::instance().read(mUrl, false));
    KxHttpStatus status = mWhole->httpStatus();
    if (!status.ok())
        return failure(status.reason());
    mVersion = ObjectVersion::of(status);
    mSize = mWhole->contentLength();
    if (mSize > 0)
        return {};
    mBytes = readWholeBody(*mWhole, status);
    mSize = mBytes.size();
    mWhole.reset();
    return status.ok() ? Result() : failure(status.reason());
}

qint64 RemoteFile::version() const
{
    // The generation counts what was written; the other two also change with what is only said of an object.
    const std::string& text = !mVersion.generation.empty()  ? mVersion.generation
                              : !mVersion.entityTag.empty() ? mVersion.entityTag
                                                            : mVersion.lastModified;
    if (text.empty())
        return 0;
    const QByteArray hash =
        QCryptographicHash::hash(QByteArray::fromStdString(text), QCryptographicHash::Md5);
    const auto number = static_cast<qint64>(qFromBigEndian<quint64>(hash.constData()) >> 1);
    return qMax<qint64>(1, number);
}

qint64 RemoteFile::readAt(qint64 offset, void* bytes, qint64 count)
{
    if (offset < 0 || count < 0 || mFault.bad())
        return -1;
    auto* to = static_cast<char*>(bytes);
    const qint64 wanted = qMin(count, qMax<qint64>(0, mSize - offset));
    for (qint64 done = 0; done < wanted;) {
        const qint64 at = offset + done;
        if (at < mStart || at >= end()) {
            if (!fetch(at, wanted - done))
                return -1;
            continue;
        }
        const qint64 part = qMin(wanted - done, end() - at);
        std::memcpy(to + done, mBytes.constData() + (at - mStart), static_cast<std::size_t>(part));
        done += part;
    }
    return wanted;
}

/// Moves what is held on, so that it has bytes from `offset` on: `count` of them, or more where that costs little.
bool RemoteFile::fetch(qint64 offset, qint64 count)
{
    const bool goesOn = offset == end();
    const int kept = goesOn ? qMin(kHistory, mBytes.size()) : 0;
    // A stream is read on as it comes, and hardly further than has to be.
    const qint64 least = qMax(count, mWhole != nullptr ? kStreamSpan : mSpan);
    const qint64 length = qMin(qMin(least, kMostAtOnce), mSize - offset);
    QByteArray bytes(static_cast<int>(kept + length), Qt::Uninitialized);
    std::memcpy(bytes.data(), mBytes.constData() + (mBytes.size() - kept), static_cast<std::size_t>(kept));
    try {
        mFault = mWhole != nullptr ? readOn(offset, bytes.data() + kept, length)
                                   : fetchRange(offset, bytes.data() + kept, length);
    } catch (const std::exception& fault) {
        mFault = failure(fault.what());
    }
    if (mFault.bad())
        return false;
    mSpan = qMin(2 * mSpan, kLongestSpan);
    mBytes = bytes;
    mStart = offset - kept;
    return true;
}

Result RemoteFile::fetchRange(qint64 offset, char* to, qint64 count) const
{
    KxCurlDownloadStream stream = openRange(mUrl, offset, count);
    const KxHttpStatus status = stream.httpStatus();
    if (!status.ok())
        return failure(status.reason());
    const std::optional<ContentRange> part = contentRangeOf(status);
    if (status.code != kPartialContent || !part || part->total != mSize || part->range.first != offset ||
        part->range.length() != count || ObjectVersion::of(status) != mVersion)
        return changed();
    return readBody(stream, to, count);
}

Result RemoteFile::readOn(qint64 offset, char* to, qint64 count)
{
    qint64 at = end();
    // What has gone by comes again with the whole.
    if (offset < at) {
        *mWhole = KxCurlClient::instance().read(mUrl, false);
        const KxHttpStatus status = mWhole->httpStatus();
        if (!status.ok())
            return failure(status.reason());
        if (mWhole->contentLength() != mSize || ObjectVersion::of(status) != mVersion)
            return changed();
        at = 0;
    }
    mWhole->ignore(offset - at);
    if (mWhole->read(to, count).gcount() == count)
        return {};
    const std::string reason = mWhole->httpStatus().reason();
    return failure(reason.empty() ? "The server broke off" : reason);
}

}  // namespace Kdd
