#pragma once

#include <string>

namespace Kdd
{

/// Who is talked to at a URL: scheme, host and port. Taken apart by curl itself, so that what is checked is what a
/// transfer would connect to.
struct WebOrigin
{
    std::string scheme;  ///< "http" or "https"; empty: the URL was of neither kind
    std::string host;    ///< in lower case
    std::string port;

    bool isValid() const { return !scheme.empty(); }
    bool operator==(const WebOrigin& other) const
    {
        return scheme == other.scheme && host == other.host && port == other.port;
    }
};

/// Whether what goes over TLS now would go open from there on, where everybody on the way can read and change it.
inline bool leavesTls(const WebOrigin& from, const WebOrigin& to)
{
    return from.scheme == "https" && to.scheme == "http";
}

WebOrigin originOf(const std::string& url);

/// `reference` as a server names it in answer to a request to `base`: a URL, or what differs from `base`. Empty when
/// that makes no URL.
std::string resolvedUrl(const std::string& base, const std::string& reference);

}  // namespace Kdd
