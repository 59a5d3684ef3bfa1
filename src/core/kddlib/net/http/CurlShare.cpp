#include "kddlib/net/http/CurlShare.h"

#include <stdexcept>
#include <string>

namespace Kdd
{
namespace
{

template <typename Value>
void setOption(CURLSH* share, CURLSHoption option, Value value)
{
    const CURLSHcode code = curl_share_setopt(share, option, value);
    if (code != CURLSHE_OK)
        throw std::runtime_error(std::string("Curl share: ") + curl_share_strerror(code));
}

}  // namespace

CurlShare::CurlShare(Connections connections)
    : mHandle(curl_share_init())
{
    if (!mHandle)
        throw std::runtime_error("Curl share: out of memory");
    // First of all: from the first kind that is shared on curl calls them. It holds one of a kind at a time and
    // lets go of it on the same thread, so plain mutexes do.
    setOption(handle(), CURLSHOPT_LOCKFUNC, &lock);
    setOption(handle(), CURLSHOPT_UNLOCKFUNC, &unlock);
    setOption(handle(), CURLSHOPT_USERDATA, static_cast<void*>(&mMutexes));
    setOption(handle(), CURLSHOPT_SHARE, CURL_LOCK_DATA_DNS);
    setOption(handle(), CURLSHOPT_SHARE, CURL_LOCK_DATA_SSL_SESSION);
    if (connections == Connections::Shared)
        setOption(handle(), CURLSHOPT_SHARE, CURL_LOCK_DATA_CONNECT);
}

std::mutex* CurlShare::mutexFor(curl_lock_data kind, void* mutexes)
{
    Mutexes& all = *static_cast<Mutexes*>(mutexes);
    switch (kind) {
    case CURL_LOCK_DATA_SHARE:
        return &all.share;
    case CURL_LOCK_DATA_DNS:
        return &all.names;
    case CURL_LOCK_DATA_SSL_SESSION:
        return &all.tlsSessions;
    case CURL_LOCK_DATA_CONNECT:
        return &all.connections;
    // Kinds of a later curl are not shared here.
    default:
        return nullptr;
    }
}

void CurlShare::lock(CURL* /*easy*/, curl_lock_data kind, curl_lock_access /*access*/, void* mutexes)
{
    if (std::mutex* mutex = mutexFor(kind, mutexes))
        mutex->lock();
}

void CurlShare::unlock(CURL* /*easy*/, curl_lock_data kind, void* mutexes)
{
    if (std::mutex* mutex = mutexFor(kind, mutexes))
        mutex->unlock();
}

}  // namespace Kdd
