#pragma once

#include "kddlib/net/cloud/KxCurlUploadSession.h"

#include <memory>
#include <streambuf>
#include <string>

namespace Kdd
{

/// Gathers what is written to an upload stream until there is enough for a chunk.
///
/// It keeps what it gathers until the storage has confirmed it, and never more than its capacity. The first error ends
/// the upload: the log names it, nothing more is sent, and no object comes into being.
class KxCurlUploadStreambuf : public std::streambuf
{
public:
    static constexpr int kCapacity = 32 * KxCurlUploadSession::kGranularity;  // 8 MiB

    /// Owns the session. `capacity` [bytes] is a multiple of the session's granularity.
    explicit KxCurlUploadStreambuf(std::unique_ptr<KxCurlUploadSession> session, int capacity = kCapacity);

    bool isOpen() const { return mIsOpen; }

    /// Sends the rest, which makes the object, and closes. Only while open. False, with a warning in the log, when that
    /// fails, or when something failed before.
    bool close();

    /// Closes without making an object.
    void abandon();

    /// From now on `error` alone tells what ended the upload, not the log as well.
    void leaveErrorsToCaller() { mLogsErrors = false; }

    /// What ended the upload; empty as long as nothing did.
    const std::string& error() const { return mError; }

protected:
    int_type overflow(int_type character) override;
    int sync() override;

private:
    template <typename Step>
    bool guard(const char* step, Step work);
    QByteArray pending() const;
    bool flushWholeChunks();

    std::unique_ptr<KxCurlUploadSession> mSession;
    const int mCapacity;
    std::unique_ptr<char[]> mBytes;  // not cleared, so that small uploads touch little of it
    std::string mError;
    bool mIsOpen = true;
    bool mLogsErrors = true;
};

}  // namespace Kdd
