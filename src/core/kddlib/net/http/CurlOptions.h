#pragma once

#include "kddlib/net/http/CurlError.h"

#include <curl/curl.h>

#include <array>
#include <memory>
#include <string>

namespace Kdd
{

class CurlShare;
class KxCurlHandleFactory;

/// Where curl describes the error of a request.
using CurlErrorText = std::array<char, CURL_ERROR_SIZE>;

/// Sets options of one easy handle. Whatever curl refuses is thrown as CurlError. Neither the handle nor the text is
/// kept beyond what curl itself keeps: the text must last as long as the options do.
class CurlOptions
{
public:
    CurlOptions(CURL* easy, CurlErrorText& errorText)
        : mEasy(easy)
        , mErrorText(errorText)
    {
        errorText[0] = '\0';
        set(CURLOPT_ERRORBUFFER, errorText.data());
    }

    template <typename Value>
    void set(CURLoption option, Value value)
    {
        const CURLcode code = curl_easy_setopt(mEasy, option, value);
        if (code != CURLE_OK)
            throw CurlError(code, mErrorText.data());
    }

    /// All that requests of every kind have in common: the shared caches, whom to trust, ciphers, sockets, limits.
    void setTransport(const std::string& url, const CurlShare& share, const KxCurlHandleFactory& factory);

private:
    void setVerification();

    CURL* mEasy;
    CurlErrorText& mErrorText;
};

/// The header lines of a request, each name, colon, blank, value and no line end.
class HeaderLines
{
public:
    /// std::runtime_error "Failed to add curl request header" when memory is short or the line has a line end in it,
    /// with which a value could bring headers of its own.
    void add(const std::string& line);

    /// Owned by this object; changes with the next `add`.
    curl_slist* list() const { return mList.get(); }

private:
    struct Free
    {
        void operator()(curl_slist* list) const { curl_slist_free_all(list); }
    };
    std::unique_ptr<curl_slist, Free> mList;
};

}  // namespace Kdd
