#pragma once

#include <curl/curl.h>

#include <memory>
#include <mutex>

namespace Kdd
{

/// What all requests of a client have in common: DNS answers and TLS sessions, so that a request need not begin with
/// finding the server and a full handshake; on request open connections as well.
///
/// Any number of threads may run requests on it. It must outlive the requests.
class CurlShare
{
public:
    /// PerHandle: each pooled handle keeps connections of its own. Shared: curl documents that as unsupported between
    /// threads, and many of them with many servers end the process within seconds.
    enum class Connections { Shared, PerHandle };

    /// std::runtime_error when curl refuses.
    explicit CurlShare(Connections connections);
    CurlShare(const CurlShare&) = delete;
    CurlShare& operator=(const CurlShare&) = delete;

    CURLSH* handle() const { return mHandle.get(); }

private:
    struct Cleanup
    {
        void operator()(CURLSH* handle) const { curl_share_cleanup(handle); }
    };

    struct Mutexes
    {
        std::mutex share;
        std::mutex names;
        std::mutex tlsSessions;
        std::mutex connections;
    };

    static std::mutex* mutexFor(curl_lock_data kind, void* mutexes);
    static void lock(CURL* easy, curl_lock_data kind, curl_lock_access access, void* mutexes);
    static void unlock(CURL* easy, curl_lock_data kind, void* mutexes);

    Mutexes mMutexes;
    std::unique_ptr<CURLSH, Cleanup> mHandle;  // goes first: its release still locks the mutexes
};

}  // namespace Kdd
