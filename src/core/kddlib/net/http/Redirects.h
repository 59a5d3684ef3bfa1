#pragma once

#include "kddlib/net/http/PreparedRequest.h"

#include <string>

namespace Kdd
{

struct KxHttpStatus;

/// Follows a request from server to server: where it is to go next, and what may be sent there.
class Redirects
{
public:
    enum class Answer { Final, GoOn, Refused };

    /// `url` is what is asked for first.
    explicit Redirects(std::string url)
        : mUrl(std::move(url))
    {
    }

    /// Whether an answer leads on. Refused, with `fault` as the reason: to no address, from HTTPS to HTTP, or for the
    /// sixth time.
    Answer take(const KxHttpStatus& status);

    /// The first request as it is to go out now. An origin that was left is not trusted again, for others sent us back.
    PreparedRequest prepared(PreparedRequest first, const ClientSettings& settings) const
    {
        return redirected(std::move(first), mUrl, !mHasLeft, settings);
    }

    const std::string& fault() const { return mFault; }

private:
    Answer refuse(const std::string& reason);

    std::string mUrl;
    std::string mFault;
    int mCount = 0;
    bool mHasLeft = false;
};

}  // namespace Kdd
