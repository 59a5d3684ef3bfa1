#pragma once

#include <string>

namespace Kdd
{

// The forms of addresses that the library takes, and the URLs that requests are made of.

/// Whether a name is to be fetched rather than opened: begins with "http" or with "gs", whatever follows.
bool isUrl(const char* name);

/// The URL of a path of the own web service. The path is not escaped.
std::string webServiceUrl(const std::string& path);

/// `url` with the session `id` as the query's "s"; not escaped. An empty id changes nothing.
std::string withSessionId(const std::string& url, const std::string& id);

/// Whether it is "gs:" and any number of "/", then bucket, "/", object.
bool isCloudAddress(const std::string& address);

/// Whether it is such an address with neither bucket nor object missing.
bool namesCloudObject(const std::string& address);

/// The cloud storage's hosts. Download: streamed reads; Upload: requests with a body; Api: all else.
enum class CloudEndpoint { Download, Upload, Api };

/// The URL of a cloud address. Each "/" inside the object's name is escaped but for one that follows an escaped one;
/// nothing else is. Without an object the URL ends with the bucket.
std::string cloudUrl(const std::string& address, CloudEndpoint endpoint);

/// Host of the storage's general address, with its port when that is not the usual one.
std::string cloudApiHost();

}  // namespace Kdd
