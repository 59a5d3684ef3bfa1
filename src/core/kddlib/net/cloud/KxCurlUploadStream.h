#pragma once

#include "platform/base/Export.h"

#include <memory>
#include <ostream>
#include <string>

namespace Kdd
{

class KxCurlUploadStreambuf;

/// Writes an object of the cloud storage. Made by KxCurlClient::write.
///
/// The object comes into being, as a whole, with a `close` that succeeds; what was written before is never seen. Up to
/// 8 MiB are held back and sent when that many have gathered; flushing sends multiples of 256 KiB of them. Transient
/// faults are retried for some 15 to 20 seconds for each such chunk, during which the writing thread sleeps.
///
/// An upload that fails sets badbit, or failbit when closing; then nothing more is sent and there is no object. There
/// may be one all the same, a whole one, when the answer to the last bytes was lost.
///
/// For one thread. A stream that was moved from is bad.
class KDD_EXPORT KxCurlUploadStream : public std::ostream
{
public:
    explicit KxCurlUploadStream(std::unique_ptr<KxCurlUploadStreambuf> buffer);

    /// Closes an open stream; who wants to know whether that succeeds closes it himself, and who does not want the
    /// object abandons it.
    ~KxCurlUploadStream() override;

    KxCurlUploadStream(KxCurlUploadStream&& other) noexcept;

    /// Closes an open stream first.
    KxCurlUploadStream& operator=(KxCurlUploadStream&& other) noexcept;

    /// From the making until `close` or `abandon`.
    bool isOpen() const;

    /// Sends the rest and makes the object. Sets failbit when that fails or writing failed before.
    void close();

    /// Ends the upload without an object.
    void abandon();

    /// Why the upload failed; empty when it did not.
    std::string error() const;

    /// For a caller who tells of `error` himself: the log does not from now on.
    void leaveErrorsToCaller();

private:
    void closeSilently() noexcept;
    void takeBuffer(KxCurlUploadStream& other);

    std::unique_ptr<KxCurlUploadStreambuf> mBuffer;
};

}  // namespace Kdd
