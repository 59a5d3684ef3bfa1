#pragma once

#include "platform/base/Result.h"

#include <string>
#include <vector>

namespace Kdd
{

// The addresses of the cloud storage: "gs:" and any number of "/", then bucket, "/", object.

bool isCloudAddress(const std::string& address);

/// Whether an object can be written or deleted under an address; the reason is to be read after it. An object has a
/// name of its own: what a query, a broken escape or a folder of dots would make of it might be another one's.
Result checkCloudObject(const std::string& address);

/// The cloud storage's hosts. Download: streamed reads; Upload: requests with a body; Api: all else.
enum class CloudEndpoint { Download, Upload, Api };

/// The URL of a cloud address, escaped as a name. Each "/" inside the object's name is escaped, too, but for one that
/// follows an escaped one. Without an object the URL ends with the bucket.
std::string cloudUrl(const std::string& address, CloudEndpoint endpoint);

/// Host of the storage's general address, with its port when that is not the usual one.
std::string cloudApiHost();

/// The header lines that requests to the cloud storage carry along with `authorization`.
std::vector<std::string> cloudHeaders(const std::string& authorization);

}  // namespace Kdd
