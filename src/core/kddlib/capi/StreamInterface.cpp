#include "kddlib/capi/Border.h"
#include "kddlib/capi/kddstream.h"
#include "kddlib/net/KxCurlClient.h"
#include "kddlib/net/http/KxCurlDownloadStream.h"
#include "kddlib/net/http/KxHttpStatus.h"
#include "platform/base/LogFile.h"

#include <array>
#include <memory>

using namespace Kdd;

namespace
{

struct UserInfo
{
    KxCurlDownloadStream stream{nullptr};
    std::array<char, KDD_BLOCK_SIZE> block;  // only what was read into it is ever looked at
};

/// Whether all has gone well so far; an error line when not.
bool isOk(KxCurlDownloadStream& stream, const char* url)
{
    const KxHttpStatus& status = stream.httpStatus();
    if (!status.ok())
        LogFile::errorf("Reading %s failed: %s", url, status.reason().c_str());
    return status.ok();
}

/// What opening an object and opening a range have in common; `open` makes the request.
template <typename Opening>
int openStream(const char* url, void** handle, const Opening& open)
{
    auto stream = std::make_unique<KxCurlDownloadStream>(open(KxCurlClient::instance()));
    // Only an opened stream is handed out: on failure the caller's handle stays as it was.
    if (!isOk(*stream, url))
        return KDD_STREAM_FAILED;
    *handle = stream.release();
    return KDD_STREAM_OPENED;
}

/// How many bytes came into the block; -1 when the transfer has failed.
std::streamsize readBlock(UserInfo& info, const char* url)
{
    // A transfer that failed has nothing more to give, however often it is asked.
    if (!isOk(info.stream, url))
        return -1;
    const std::streamsize count =
        info.stream.read(info.block.data(), static_cast<std::streamsize>(info.block.size())).gcount();
    // A transfer that breaks off looks like an end to the reader.
    return info.stream.bad() || !isOk(info.stream, url) ? -1 : count;
}

}  // namespace

int OpenStream(const char* url, void** stream)
{
    return guarded(__func__, int{KDD_STREAM_FAILED}, [&](const char* function) -> int {
        if (!isGiven(function, "the URL", url) || !isGiven(function, "the stream", stream))
            return KDD_STREAM_FAILED;
        return openStream(url, stream, [url](KxCurlClient& client) { return client.read(url, false); });
    });
}

int OpenStreamRange(const char* url, const char* range, void** stream)
{
    return guarded(__func__, int{KDD_STREAM_FAILED}, [&](const char* function) -> int {
        if (!isGiven(function, "the URL", url) || !isGiven(function, "the range", range) ||
            !isGiven(function, "the stream", stream))
            return KDD_STREAM_FAILED;
        return openStream(url, stream,
                          [=](KxCurlClient& client) { return client.readRange(url, range, false); });
    });
}

int32_t ReadBytes(void* stream, void* buffer, int32_t offset, int32_t count)
{
    return guarded(__func__, 0, [&](const char* function) {
        if (!isGiven(function, "the stream", stream) || !isGiven(function, "the buffer", buffer) ||
            !isCount(function, "the offset", offset) || !isCount(function, "the count", count))
            return 0;
        auto& from = *static_cast<KxCurlDownloadStream*>(stream);
        return static_cast<int32_t>(from.read(static_cast<char*>(buffer) + offset, count).gcount());
    });
}

uint64_t StreamContentLength(void* stream)
{
    return guarded(__func__, uint64_t{0}, [&](const char* function) {
        return isGiven(function, "the stream", stream)
                   ? static_cast<uint64_t>(static_cast<KxCurlDownloadStream*>(stream)->contentLength())
                   : 0;
    });
}

void CloseStream(void* stream)
{
    delete static_cast<KxCurlDownloadStream*>(stream);
}

void* CreateUserInfo()
{
    return guarded(__func__, static_cast<void*>(nullptr),
                   [](const char* /*function*/) -> void* { return new UserInfo; });
}

void DeleteUserInfo(void* userInfo)
{
    delete static_cast<UserInfo*>(userInfo);
}

int ReadDicomFromUrl(const char* url, void* userInfo, uint32_t* length, const char** data, int32_t isFirst,
                     uint32_t* isLast)
{
    return guarded(__func__, int{KDD_NOT_READ}, [&](const char* function) -> int {
        if (!isGiven(function, "the length", length) || !isGiven(function, "the data", data) ||
            !isGiven(function, "the last flag", isLast))
            return KDD_NOT_READ;
        // Set at once, so that whoever forgets to look at the result finds nothing to read.
        *length = *isLast = 0;
        *data = nullptr;
        if (!isGiven(function, "the user info", userInfo) || (isFirst && !isGiven(function, "the URL", url)))
            return KDD_NOT_READ;
        auto& info = *static_cast<UserInfo*>(userInfo);
        if (isFirst) {
            // Should the opening throw, nothing of an earlier object may follow.
            info.stream = KxCurlDownloadStream(nullptr);
            info.stream = KxCurlClient::instance().read(url, false);
        }
        const std::streamsize count = readBlock(info, url != nullptr ? url : "the object");
        const bool isOver = count < 0 || info.stream.eof();
        if (isOver)
            // Frees the connection: who has got the last block may keep the user info for long.
            info.stream.close();
        if (count < 0)
            return KDD_NOT_READ;
        *length = static_cast<uint32_t>(count);
        *data = info.block.data();
        *isLast = isOver ? 1 : 0;
        return KDD_READ;
    });
}

bool DeleteObject(const char* url)
{
    return guarded(__func__, false, [&](const char* function) {
        return isGiven(function, "the URL", url) && KxCurlClient::instance().deleteObject(url);
    });
}

bool StringIsUrl(const char* text)
{
    // Takes null and throws nothing, so there is nothing to guard.
    return KxCurlClient::isUrl(text);
}
