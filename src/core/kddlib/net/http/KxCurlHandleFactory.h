#pragma once

#include "kddlib/net/http/CurlShare.h"

#include <curl/curl.h>

#include <cstddef>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

namespace Kdd
{

struct CurlEasyCleanup
{
    void operator()(CURL* handle) const { curl_easy_cleanup(handle); }
};
struct CurlMultiCleanup
{
    void operator()(CURLM* handle) const { curl_multi_cleanup(handle); }
};
using CurlEasy = std::unique_ptr<CURL, CurlEasyCleanup>;
using CurlMulti = std::unique_ptr<CURLM, CurlMultiCleanup>;

/// Keeps curl handles between requests, because making one costs memory and its connections go with it.
///
/// Any thread may use it.
class KxCurlHandleFactory
{
public:
    /// Keeps up to `capacity` idle handles of each kind, at least one; `connections` is how their requests will hold
    /// them. The cipher list is taken from the environment variable SSL_CIPHER_LIST where that is set, be it empty.
    explicit KxCurlHandleFactory(std::size_t capacity,
                                 CurlShare::Connections connections = CurlShare::Connections::PerHandle);

    /// A handle without options, idle or new. std::bad_alloc when curl cannot make one.
    CurlEasy takeEasy();

    /// Clears all options at once, so that the handle keeps no pointer into a request that is gone. When the pool is
    /// full the handle that was idle for longest is cleaned up.
    void giveBack(CurlEasy handle);

    /// An idle multi handle while easy handles are idle as well, else a new one.
    CurlMulti takeMulti();

    /// All easy handles must have been removed from it.
    void giveBack(CurlMulti handle);

    /// TLS ciphers up to TLS 1.2 in OpenSSL's form; empty leaves the choice to the TLS library.
    const std::string& cipherList() const { return mCipherList; }

    /// Connections that a multi handle taken from now on keeps open.
    int maxConnects() const;
    void setMaxConnects(int count);

    /// How many open connections a transfer leaves at its end: `maxConnects`. Where connections are shared, a transfer
    /// that ends trims those of all threads to its own limit, so there it is as many as handles are kept or in use, too.
    long connectionLimit() const;

private:
    long connectionLimitLocked() const;

    const std::size_t mCapacity;
    const CurlShare::Connections mConnections;
    mutable std::mutex mMutex;
    std::vector<CurlEasy> mEasy;
    std::vector<CurlMulti> mMulti;
    std::string mCipherList;
    int mMaxConnects = 8;
    std::size_t mInUse = 0;  // easy handles
};

}  // namespace Kdd
