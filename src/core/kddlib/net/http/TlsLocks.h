#pragma once

#include <string>

namespace Kdd
{

/// What the locks need of the cryptography library, so that they can be tried without the old one that wants them.
class CryptoLibrary
{
public:
    using LockingCallback = void (*)(int mode, int number, const char* file, int line);

    virtual ~CryptoLibrary() = default;

    /// As "OpenSSL 1.0.2k  26 Jan 2017".
    virtual std::string versionText() const = 0;
    virtual bool hasLockingCallback() const = 0;
    virtual int lockCount() const = 0;
    virtual void setLockingCallback(LockingCallback callback) = 0;
};

/// The one that is linked.
CryptoLibrary& linkedCryptoLibrary();

/// Gives a cryptography library that does not lock by itself (OpenSSL 1.0, LibreSSL 2) the locks without which it must
/// not be used on several threads. `curlTlsVersion` is what curl names as its TLS library, as "OpenSSL/1.0.2k"; a log
/// line tells what was done, and an error when curl was linked against another library than this one.
///
/// The locks last until the process ends; a second library would take those of the first away.
void installTlsLocks(const std::string& curlTlsVersion, CryptoLibrary& library);

}  // namespace Kdd
