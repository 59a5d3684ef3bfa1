#pragma once

#include "kddlib/net/http/PreparedRequest.h"

#include <string>
#include <utility>

namespace Kdd
{

class Result;
struct KxHttpStatus;

/// Follows a request from server to server: where it is to go next, and what may be sent there.
class Redirects
{
public:
    /// `url` is what is asked for first.
    explicit Redirects(std::string url)
        : mUrl(std::move(url))
    {
    }

    /// Whether an answer leads on, and then to where. Not when `result` turns bad: the answer leads to no address, from
    /// HTTPS to HTTP, or on for the sixth time.
    bool follow(const KxHttpStatus& status, Result& result);

    /// The first request as it is to go out now. An origin that was left is not trusted again, for others sent us back.
    PreparedRequest prepared(PreparedRequest first, const std::string& sessionId) const
    {
        return redirected(std::move(first), mUrl, !mHasLeft, sessionId);
    }

private:
    std::string mUrl;
    int mCount = 0;
    bool mHasLeft = false;
};

}  // namespace Kdd
