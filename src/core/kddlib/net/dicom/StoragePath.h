#pragma once

#include <string>

namespace Kdd
{

// Names of files on the storage servers, "/Storage/HOST/REST" or "//HOST/REST" with "/" or "\" between the parts, and
// the addresses under which those servers hand the files out. REST is escaped as `escapedName` has it.

/// "http://HOST:port/REST". Empty for a name of any other form, or with a HOST that can be none.
std::string storageUrl(const std::string& name, const std::string& port);

/// The same through the own web service, which passes REST on.
std::string externalStorageUrl(const std::string& name);

}  // namespace Kdd
