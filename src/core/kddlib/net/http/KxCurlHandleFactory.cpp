#include "kddlib/net/http/KxCurlHandleFactory.h"

#include <algorithm>
#include <cstdlib>
#include <new>
#include <utility>

namespace Kdd
{
namespace
{

std::string cipherListOfSite()
{
    // Set but empty is an answer too: it leaves the choice to the TLS library.
    const char* list = std::getenv("SSL_CIPHER_LIST");
    return list ? list : "AES128-GCM-SHA256";
}

template <typename Handle>
Handle takeLast(std::vector<Handle>& pool)
{
    Handle handle = std::move(pool.back());
    pool.pop_back();
    return handle;
}

/// Returns the handle that has to go.
template <typename Handle>
Handle keep(std::vector<Handle>& pool, std::size_t capacity, Handle handle)
{
    Handle oldest;
    // The one that was idle for longest goes: its connections are the likeliest to have been closed.
    if (pool.size() >= capacity) {
        oldest = std::move(pool.front());
        pool.erase(pool.begin());
    }
    pool.push_back(std::move(handle));
    return oldest;
}

template <typename Handle>
Handle checked(Handle handle)
{
    if (!handle)
        throw std::bad_alloc();
    return handle;
}

}  // namespace

KxCurlHandleFactory::KxCurlHandleFactory(std::size_t capacity, CurlShare::Connections connections)
    : mCapacity(std::max<std::size_t>(capacity, 1))
    , mConnections(connections)
    , mCipherList(cipherListOfSite())
{
    mEasy.reserve(mCapacity);
    mMulti.reserve(mCapacity);
}

CurlEasy KxCurlHandleFactory::takeEasy()
{
    const std::lock_guard lock(mMutex);
    CurlEasy handle = mEasy.empty() ? checked(CurlEasy(curl_easy_init())) : takeLast(mEasy);
    ++mInUse;
    return handle;
}

void KxCurlHandleFactory::giveBack(CurlEasy handle)
{
    curl_easy_reset(handle.get());
    // Resetting spares the share, which could not be released while an idle handle holds on to it.
    curl_easy_setopt(handle.get(), CURLOPT_SHARE, nullptr);
    CurlEasy oldest;  // cleaned up after the lock is gone, because that may close connections
    const std::lock_guard lock(mMutex);
    --mInUse;
    oldest = keep(mEasy, mCapacity, std::move(handle));
}

CurlMulti KxCurlHandleFactory::takeMulti()
{
    const std::lock_guard lock(mMutex);
    const bool isReused = !mEasy.empty() && !mMulti.empty();
    CurlMulti handle = isReused ? takeLast(mMulti) : checked(CurlMulti(curl_multi_init()));
    // Of a reused one, too: the limit may have been changed, or raised for a download, since.
    curl_multi_setopt(handle.get(), CURLMOPT_MAXCONNECTS, connectionLimitLocked());
    return handle;
}

void KxCurlHandleFactory::giveBack(CurlMulti handle)
{
    CurlMulti oldest;
    const std::lock_guard lock(mMutex);
    oldest = keep(mMulti, mCapacity, std::move(handle));
}

int KxCurlHandleFactory::maxConnects() const
{
    const std::lock_guard lock(mMutex);
    return mMaxConnects;
}

void KxCurlHandleFactory::setMaxConnects(int count)
{
    const std::lock_guard lock(mMutex);
    mMaxConnects = count;
}

long KxCurlHandleFactory::connectionLimit() const
{
    const std::lock_guard lock(mMutex);
    return connectionLimitLocked();
}

long KxCurlHandleFactory::connectionLimitLocked() const
{
    const long least = std::max(mMaxConnects, 1);
    const bool isShared = mConnections == CurlShare::Connections::Shared;
    return isShared ? std::max(least, static_cast<long>(std::max(mCapacity, mInUse + 1))) : least;
}

}  // namespace Kdd
