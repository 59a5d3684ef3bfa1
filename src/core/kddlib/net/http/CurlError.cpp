#include "kddlib/net/http/CurlError.h"

#include "platform/base/LogFile.h"

#include <curl/curl.h>

namespace Kdd
{

CurlError::CurlError(int code, const char* description)
    : mMessage("Error code: ")
{
    mMessage += curl_easy_strerror(static_cast<CURLcode>(code));
    // Curl quotes servers there.
    if (description && *description)
        mMessage.append("\nError description: ").append(LogFile::escaped(description));
    if (const std::string cure = cureFor(code); !cure.empty())
        mMessage.append("\n").append(cure);
}

std::string CurlError::cureFor(int code)
{
    // The default list has no cipher for servers that offer TLS 1.2 with ECDHE only, and their answer does not say so.
    if (code == CURLE_SSL_CONNECT_ERROR || code == CURLE_SSL_CIPHER)
        return "If the server accepts none of the ciphers offered, name others in SSL_CIPHER_LIST.";
    return {};
}

std::string textForLog(const std::exception& error)
{
    const bool isOwn = dynamic_cast<const CurlError*>(&error) != nullptr;
    return isOwn ? error.what() : LogFile::escaped(error.what());
}

}  // namespace Kdd
