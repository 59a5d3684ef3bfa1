#pragma once

#include <string>

namespace Kdd
{

// Names of files on the storage servers, "/Storage/HOST/REST" or "//HOST/REST" with "/" or "\" between the parts, and
// the addresses under which those servers hand the files out. Nothing is escaped.

/// "http://HOST:port/REST". Empty for a name of any other form.
std::string storageUrl(const std::string& name, const std::string& port);

/// The same through the own web service, which passes REST on. Empty for a name of any other
/// form.
std::string externalStorageUrl(const std::string& name);

}  // namespace Kdd
