#include "kddlib/net/CurlError.h"

#include <curl/curl.h>

namespace Kdd
{

CurlError::CurlError(int code, const char* description)
    : mMessage("Error code: ")
{
    mMessage += curl_easy_strerror(static_cast<CURLcode>(code));
    if (description && *description)
        mMessage.append("\nError description: ").append(description);
    mMessage += cureFor(code);
}

std::string CurlError::cureFor(int code)
{
    // The default list has no cipher for servers that offer TLS 1.2 with ECDHE only, and their answer does not say so.
    if (code == CURLE_SSL_CONNECT_ERROR || code == CURLE_SSL_CIPHER)
        return "\nIf the server accepts none of the ciphers offered, name others in SSL_CIPHER_LIST.";
    return {};
}

}  // namespace Kdd
