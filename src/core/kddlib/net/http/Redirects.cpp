#include "kddlib/net/http/Redirects.h"

#include "kddlib/net/http/HttpAnswer.h"
#include "kddlib/net/http/KxHttpStatus.h"
#include "kddlib/net/http/WebOrigin.h"
#include "platform/base/Result.h"

#include <algorithm>
#include <iterator>

namespace Kdd
{
namespace
{

constexpr int kMostRedirects = 5;

bool isRedirect(int code)
{
    // Not 300, which leaves a choice, nor 304, which leads nowhere.
    constexpr int kCodes[] = {301, 302, 303, 307, 308};
    return std::find(std::begin(kCodes), std::end(kCodes), code) != std::end(kCodes);
}

Result refusal(const std::string& whereTo)
{
    return Result::failure(QString::fromStdString("The server redirects " + whereTo));
}

}  // namespace

bool Redirects::follow(const KxHttpStatus& status, Result& result)
{
    const std::string* const location = findHeader(status, "location");
    if (status.failed || !isRedirect(status.code) || !location)
        return false;
    // Against the page that answered, not the first address: a server may name a path only.
    const std::string url = resolvedUrl(mUrl, *location);
    const WebOrigin from = originOf(mUrl);
    const WebOrigin to = originOf(url);
    if (++mCount > kMostRedirects)
        result = refusal("more than " + std::to_string(kMostRedirects) + " times");
    else if (!to.isValid())
        result = refusal("to \"" + *location + "\", which is no address of HTTP");
    else if (leavesTls(from, to))
        result = refusal("from HTTPS to \"" + url + "\"");
    if (result.bad())
        return false;
    // Never taken back: a way home that another server chose is not to be trusted.
    mHasLeft |= !(from == to);
    mUrl = url;
    return true;
}

}  // namespace Kdd
