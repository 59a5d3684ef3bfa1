#include "kddlib/net/http/WholeBody.h"

#include "kddlib/Limits.h"
#include "kddlib/net/http/KxCurlDownloadStream.h"

namespace Kdd
{
namespace
{

constexpr int kFirstReadSize = 128 * 1024;  // [bytes]

/// The rest of a stream of which nobody says how long it is, up to the bound of a response.
QByteArray readUntilEnd(std::istream& stream)
{
    QByteArray bytes(kFirstReadSize, Qt::Uninitialized);
    qint64 got = 0;
    while (got < kMaxResponseSize && stream.read(bytes.data() + got, bytes.size() - got).gcount() > 0) {
        got += stream.gcount();
        // Grown before it is full: a read without room would look like the end.
        if (got > bytes.size() / 2)
            bytes.resize(static_cast<int>(qMin(2 * qint64(bytes.size()), kMaxResponseSize)));
    }
    bytes.resize(static_cast<int>(got));
    return bytes;
}

}  // namespace

QByteArray readWholeBody(KxCurlDownloadStream& stream, KxHttpStatus& status)
{
    // A length beyond the bound is a claim like any other: memory is taken as the bytes come.
    const qint64 length = stream.httpStatus().failed ? 0 : stream.contentLength();
    QByteArray bytes;
    if (length > 0 && length <= kMaxResponseSize) {
        bytes = QByteArray(static_cast<int>(length), Qt::Uninitialized);
        bytes.resize(static_cast<int>(stream.read(bytes.data(), length).gcount()));
        stream.peek();  // sees the end, with which the connection is free for the next
    } else {
        bytes = readUntilEnd(stream);
    }
    status = stream.httpStatus();
    // No status of the server tells that reading ended at our bound.
    if (stream.isOpen() && !status.failed) {
        status.failed = true;
        status.failure = "The response has a body of more than 1 GiB";
    }
    return bytes;
}

}  // namespace Kdd
