#include "kddlib/net/http/KxCurlDownloadRequest.h"

#include <algorithm>
#include <stdexcept>
#include <utility>

namespace Kdd
{
namespace
{

/// A sleep ends when a socket or one of curl's own timers asks for it, so its length costs no latency.
constexpr int kLongestWait = 1000;  // [ms]

/// What two sockets buffer. Driving more often costs processor time, as each socket then has little to give.
constexpr std::size_t kBytesBetweenDrives = 512 * 1024;

void check(CURLMcode code)
{
    if (code != CURLM_OK)
        throw std::runtime_error(std::string("Curl: ") + curl_multi_strerror(code));
}

}  // namespace

KxCurlDownloadRequest::MultiMap::MultiMap(std::shared_ptr<KxCurlHandleFactory> factory)
    : mFactory(std::move(factory))
    , mMulti(mFactory->takeMulti())
{
}

KxCurlDownloadRequest::MultiMap::~MultiMap()
{
    mFactory->giveBack(std::move(mMulti));
}

void KxCurlDownloadRequest::MultiMap::add(KxCurlDownloadRequest& request)
{
    CURL* const easy = request.mEasy.get();
    // Entered first, so that the limit below counts this one too.
    mRequests[easy] = &request;
    // With fewer than there are requests, each range that ends would close the connection that the next one needs.
    const long limit = std::max(mFactory->connectionLimit(), static_cast<long>(mRequests.size()));
    curl_multi_setopt(mMulti.get(), CURLMOPT_MAXCONNECTS, limit);
    try {
        check(curl_multi_add_handle(mMulti.get(), easy));
    } catch (...) {
        mRequests.erase(easy);
        throw;
    }
}

void KxCurlDownloadRequest::MultiMap::remove(KxCurlDownloadRequest& request)
{
    CURL* const easy = request.mEasy.get();
    // The map knows whether it is in: requests end by themselves, are broken off and destroyed, in any order.
    if (mRequests.erase(easy) > 0)
        curl_multi_remove_handle(mMulti.get(), easy);
}

void KxCurlDownloadRequest::MultiMap::drive(KxCurlDownloadRequest& reader,
                                            const std::function<bool()>& isEnough)
{
    mReadSinceDriven = 0;
    // Without a transfer under way nothing would ever wake the wait.
    int running = 1;
    while (!isEnough() && !reader.isDone() && running > 0) {
        if (!perform(reader, running))
            return;
        // Another's failure is told when its turn to be read comes; until then all that was fetched is good.
        takeCompletions();
        if (!isEnough() && !reader.isDone() && !wait(reader))
            return;
    }
}

void KxCurlDownloadRequest::MultiMap::noteRead(KxCurlDownloadRequest& reader, std::size_t count)
{
    mReadSinceDriven += count;
    if (mReadSinceDriven < kBytesBetweenDrives || mRequests.empty())
        return;
    mReadSinceDriven = 0;
    int running = 0;
    if (perform(reader, running))
        takeCompletions();
}

bool KxCurlDownloadRequest::MultiMap::perform(KxCurlDownloadRequest& reader, int& running)
{
    const CURLMcode code = curl_multi_perform(mMulti.get(), &running);
    if (code == CURLM_OK)
        return true;
    reader.fail(curl_multi_strerror(code), "curl_multi_perform failed");
    return false;
}

void KxCurlDownloadRequest::MultiMap::takeCompletions()
{
    int left = 0;
    while (const CURLMsg* message = curl_multi_info_read(mMulti.get(), &left)) {
        const auto found = mRequests.find(message->easy_handle);
        // The message goes with the handle, which is taken out in there: its result is passed by value.
        if (message->msg == CURLMSG_DONE && found != mRequests.end())
            found->second->complete(message->data.result);
    }
}

bool KxCurlDownloadRequest::MultiMap::wait(KxCurlDownloadRequest& reader)
{
    // Not curl_multi_wait, which comes back at once where there is no socket yet, while a name is looked up.
    const CURLMcode code = curl_multi_poll(mMulti.get(), nullptr, 0, kLongestWait, nullptr);
    if (code == CURLM_OK)
        return true;
    reader.fail(curl_multi_strerror(code), "curl_multi_wait");
    return false;
}

}  // namespace Kdd
