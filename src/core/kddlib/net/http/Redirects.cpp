#include "kddlib/net/http/Redirects.h"

#include "kddlib/net/http/KxHttpStatus.h"
#include "kddlib/net/http/WebOrigin.h"

#include <algorithm>
#include <iterator>

namespace Kdd
{
namespace
{

constexpr int kMostRedirects = 5;

bool isRedirect(int code)
{
    constexpr int kCodes[] = {301, 302, 303, 307, 308};
    return std::find(std::begin(kCodes), std::end(kCodes), code) != std::end(kCodes);
}

}  // namespace

Redirects::Answer Redirects::take(const KxHttpStatus& status)
{
    const auto location = status.headers.find("location");
    if (status.failed || !isRedirect(status.code) || location == status.headers.end())
        return Answer::Final;
    if (++mCount > kMostRedirects)
        return refuse("The server redirects more than " + std::to_string(kMostRedirects) + " times");
    const std::string url = resolvedUrl(mUrl, location->second);
    const WebOrigin from = originOf(mUrl);
    const WebOrigin to = originOf(url);
    if (!to.isValid())
        return refuse("The server redirects to \"" + location->second + "\", which is no address of HTTP");
    if (from.scheme == "https" && to.scheme == "http")
        return refuse("The server redirects from HTTPS to \"" + url + "\"");
    mHasLeft |= !(from == to);
    mUrl = url;
    return Answer::GoOn;
}

Redirects::Answer Redirects::refuse(const std::string& reason)
{
    mFault = reason;
    return Answer::Refused;
}

}  // namespace Kdd
