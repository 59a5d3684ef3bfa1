#pragma once

#include <string>
#include <string_view>

namespace Kdd
{

// The forms of addresses that the library takes, and the URLs that requests are made of.

/// Whether a name is to be fetched rather than opened: begins with "http" or with "gs", whatever follows.
bool isUrl(const char* name);

/// The URL of a path of the own web service. The path is not escaped.
std::string webServiceUrl(const std::string& path);

/// A name as it stands in an address: "#", blanks, control characters and bytes beyond ASCII are escaped, for they
/// would end the address or break it. All else stays, "%" and "?" as well: callers hand over names that are escaped
/// already, and queries.
std::string escapedName(std::string_view name);

/// `url` with the session `id` as the query's "s", before a "#"; not escaped. An empty id changes nothing.
std::string withSessionId(const std::string& url, const std::string& id);

/// Whether it is "gs:" and any number of "/", then bucket, "/", object.
bool isCloudAddress(const std::string& address);

/// Why no object can be written or deleted under an address, to be read after it; empty when one can. An object has a
/// name of its own: what a query, a broken escape or a folder of dots would make of it might be another one's.
std::string whyNoCloudObject(const std::string& address);

/// The cloud storage's hosts. Download: streamed reads; Upload: requests with a body; Api: all else.
enum class CloudEndpoint { Download, Upload, Api };

/// The URL of a cloud address, escaped as a name. Each "/" inside the object's name is escaped, too, but for one that
/// follows an escaped one. Without an object the URL ends with the bucket.
std::string cloudUrl(const std::string& address, CloudEndpoint endpoint);

/// Host of the storage's general address, with its port when that is not the usual one.
std::string cloudApiHost();

}  // namespace Kdd
