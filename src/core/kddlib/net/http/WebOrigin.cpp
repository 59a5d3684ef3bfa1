#include "kddlib/net/http/WebOrigin.h"

#include "kddlib/net/http/LowerCase.h"

#include <curl/curl.h>

#include <memory>

namespace Kdd
{
namespace
{

struct UrlCleanup
{
    void operator()(CURLU* url) const { curl_url_cleanup(url); }
};

struct TextFree
{
    void operator()(char* text) const { curl_free(text); }
};

using Url = std::unique_ptr<CURLU, UrlCleanup>;

std::string partOf(const Url& url, CURLUPart part, unsigned int flags = 0)
{
    char* text = nullptr;
    const CURLUcode code = curl_url_get(url.get(), part, &text, flags);
    const std::unique_ptr<char, TextFree> owner(text);
    return code == CURLUE_OK && text ? std::string(text) : std::string();
}

}  // namespace

WebOrigin originOf(const std::string& url)
{
    const Url parts(curl_url());
    // What curl itself cannot take apart it could not connect to either.
    if (!parts || curl_url_set(parts.get(), CURLUPART_URL, url.c_str(), 0) != CURLUE_OK)
        return {};
    // With the usual port named, so that an address with it and one without are one origin.
    WebOrigin origin = {lowerCase(partOf(parts, CURLUPART_SCHEME)), lowerCase(partOf(parts, CURLUPART_HOST)),
                        partOf(parts, CURLUPART_PORT, CURLU_DEFAULT_PORT)};
    const bool isWeb = origin.scheme == "http" || origin.scheme == "https";
    return isWeb && !origin.host.empty() ? origin : WebOrigin();
}

std::string resolvedUrl(const std::string& base, const std::string& reference)
{
    const Url url(curl_url());
    if (!url || reference.empty() || curl_url_set(url.get(), CURLUPART_URL, base.c_str(), 0) != CURLUE_OK ||
        curl_url_set(url.get(), CURLUPART_URL, reference.c_str(), 0) != CURLUE_OK)
        return {};
    return partOf(url, CURLUPART_URL);
}

}  // namespace Kdd
