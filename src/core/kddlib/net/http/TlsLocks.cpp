#include "kddlib/net/http/TlsLocks.h"

#include "platform/base/LogFile.h"

#include <openssl/crypto.h>

#include <algorithm>
#include <memory>
#include <mutex>
#include <string_view>

namespace Kdd
{
namespace
{

// Of the callback's mode: with it a lock is asked for, without it let go.
constexpr int kLockBit = 1;

using Locks = std::unique_ptr<std::mutex[]>;

/// Never destroyed, because when the process ends other threads may still be at work in the library.
Locks& locks()
{
    static auto* const all = new Locks;
    return *all;
}

bool startsWith(std::string_view text, std::string_view start)
{
    return text.substr(0, start.size()) == start;
}

void lockOrUnlock(int mode, int number, const char* /*file*/, int /*line*/)
{
    std::mutex& mutex = locks()[static_cast<std::size_t>(number)];
    if (mode & kLockBit)
        mutex.lock();
    else
        mutex.unlock();
}

/// Curl's text as the cryptography library would write it. Of LibreSSL the two agree in the first number only.
std::string asLibraryWritesIt(std::string curlVersion)
{
    constexpr std::string_view kLibre = "LibreSSL 2";
    std::replace(curlVersion.begin(), curlVersion.end(), '/', ' ');
    if (startsWith(curlVersion, kLibre))
        curlVersion.resize(kLibre.size());
    return curlVersion;
}

void reportMismatch(const std::string& curlVersion, const std::string& libraryVersion)
{
    LogFile::errorf("Mismatched versions of OpenSSL linked in libcurl vs. the version linked in kddlib."
                    "\nlibcurl is linked against %s\nwhile kddlib links against %s\nMismatched versions are "
                    "not supported.",
                    curlVersion.c_str(), libraryVersion.c_str());
}

/// From OpenSSL 1.1 on these calls are macros without effect: that library locks by itself.
class LinkedCryptoLibrary : public CryptoLibrary
{
public:
    std::string versionText() const override { return SSLeay_version(SSLEAY_VERSION); }
    bool hasLockingCallback() const override
    {
        const LockingCallback installed = CRYPTO_get_locking_callback();
        return installed != nullptr;
    }
    int lockCount() const override { return CRYPTO_num_locks(); }
    void setLockingCallback([[maybe_unused]] LockingCallback callback) override
    {
        CRYPTO_set_locking_callback(callback);
    }
};

}  // namespace

CryptoLibrary& linkedCryptoLibrary()
{
    static LinkedCryptoLibrary library;
    return library;
}

void installTlsLocks(const std::string& curlTlsVersion, CryptoLibrary& library)
{
    if (!startsWith(curlTlsVersion, "OpenSSL/1.0") && !startsWith(curlTlsVersion, "LibreSSL/2")) {
        LogFile::printf("SSL locking callbacks not installed because the SSL library does not need them.");
        return;
    }
    // The host program has threads in the library already, which hold its locks.
    if (library.hasLockingCallback()) {
        LogFile::printf("SSL locking callbacks not installed because there are callbacks already installed.");
        return;
    }
    if (!startsWith(library.versionText(), asLibraryWritesIt(curlTlsVersion)))
        reportMismatch(curlTlsVersion, library.versionText());
    LogFile::printf("Installing SSL locking callbacks.");
    locks() = std::make_unique<std::mutex[]>(static_cast<std::size_t>(std::max(library.lockCount(), 0)));
    library.setLockingCallback(&lockOrUnlock);
}

}  // namespace Kdd
