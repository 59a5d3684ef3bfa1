#pragma once

#include "kddlib/net/http/ByteRange.h"
#include "kddlib/net/http/PreparedRequest.h"

#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace Kdd
{

/// What a client's requests follow; a request takes a copy when it is prepared.
struct ClientSettings
{
    std::string sessionId;
    int numConcurrentRequestsPerFile = 1;
    int chunkSizeForPartialRequests = 12 * 1024 * 1024;  // [bytes]

    /// Gives the header line "Authorization: ..." for the cloud storage, or nothing. May be empty itself.
    std::function<std::string()> authorization;
};

/// Makes the address that a caller gave into a URL and adds what the address asks for to the caller's header lines:
/// for the cloud storage authorisation, when there is one, for all else the session's id where the host may know it.
/// A `body` goes to another host of the cloud storage. Passes on what the authorisation throws.
PreparedRequest prepareRequest(const std::string& address, std::vector<std::string> headers, RequestBody body,
                               const ClientSettings& settings);

/// What the settings' authorisation gives; empty without one.
std::string authorizationHeader(const ClientSettings& settings);

/// The first range when an object is fetched in several, from its byte `start` (0-based) on; nothing when it is fetched
/// in one piece.
std::optional<ByteRange> firstRange(const ClientSettings& settings, qint64 start = 0);

}  // namespace Kdd
