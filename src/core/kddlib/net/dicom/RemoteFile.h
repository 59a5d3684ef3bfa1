#pragma once

#include "kddlib/net/http/ObjectVersion.h"
#include "platform/base/Result.h"

#include <QByteArray>

#include <memory>
#include <string>

namespace Kdd
{

class KxCurlDownloadStream;

/// A file behind a URL, read at any place: what is asked for is fetched as ranges, the first with the opening and each
/// further one longer, so that the header of an image costs one or two requests and a value in it no more than itself.
///
/// All that is read is of the version that was met first. Once the server has another one, or breaks off, nothing is
/// read any more. Of a server that knows no ranges the object is read from its beginning on, no further than is asked for,
/// and again from the beginning for what has gone by; one whose length is not told is read as a whole.
///
/// Used by one thread at a time.
class RemoteFile
{
public:
    /// Fetches the first `first` bytes, at least 1. Null, with the reason in `result`, when the object is not to be had.
    static std::shared_ptr<RemoteFile> open(const QByteArray& url, qint64 first, Result& result);

    ~RemoteFile();
    RemoteFile(const RemoteFile&) = delete;
    RemoteFile& operator=(const RemoteFile&) = delete;

    /// [bytes]
    qint64 size() const { return mSize; }

    /// A number for the version, by which it is recognised together with the size; 0 when the server tells nothing.
    qint64 version() const;

    /// Reads up to `count` bytes at `offset` (0-based), fewer only at the end of the file; -1 when they cannot be had,
    /// which `fault` explains.
    qint64 readAt(qint64 offset, void* bytes, qint64 count);

    const Result& fault() const { return mFault; }

private:
    explicit RemoteFile(const QByteArray& url);

    Result begin(qint64 first);
    Result beginWhole();
    bool fetch(qint64 offset, qint64 count);
    Result fetchRange(qint64 offset, char* to, qint64 count) const;
    Result readOn(qint64 offset, char* to, qint64 count);
    qint64 end() const { return mStart + mBytes.size(); }

    const std::string mUrl;
    ObjectVersion mVersion;
    qint64 mSize = 0;
    QByteArray mBytes;  // what was fetched last, from mStart on
    qint64 mStart = 0;
    qint64 mSpan;                                  // of the next range, at least
    std::unique_ptr<KxCurlDownloadStream> mWhole;  // of a server without ranges, at end()
    Result mFault;
};

}  // namespace Kdd
