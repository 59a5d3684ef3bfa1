#pragma once

#include <string>
#include <string_view>

namespace Kdd
{

// The URLs that requests are made of.

/// The URL of a path of the own web service. The path is not escaped.
std::string webServiceUrl(const std::string& path);

/// A name as it stands in an address: "#", blanks, control characters and bytes beyond ASCII are escaped, for they
/// would end the address or break it. All else stays, "%" and "?" as well: callers hand over names that are escaped
/// already, and queries.
std::string escapedName(std::string_view name);

/// `url` with the session `id` as the query's "s", before a "#"; not escaped. An empty id changes nothing.
std::string withSessionId(const std::string& url, const std::string& id);

}  // namespace Kdd
