#pragma once

#include <string>
#include <vector>

namespace Kdd
{

/// A request as it goes out: where to and with which header lines.
struct PreparedRequest
{
    std::string url;
    std::vector<std::string> headers;
};

/// Whether a request has a body.
enum class RequestBody { None, Sent };

/// Whether it carries an authorisation.
bool isAuthorised(const PreparedRequest& request);

/// `url` with the session `id`, as `withSessionId` has it, where the site lets the host know the session.
std::string withSession(const std::string& url, const std::string& id);

/// What `prepared` becomes when a server has redirected it to `url`: of the same origin, with the same header lines and
/// the session again, if it had one; anywhere else (`isSameOrigin` false) with nothing but the range.
PreparedRequest redirected(PreparedRequest prepared, const std::string& url, bool isSameOrigin,
                           const std::string& sessionId);

}  // namespace Kdd
