#include "kddlib/capi/Border.h"

#include "kddlib/net/http/CurlError.h"
#include "platform/base/LogFile.h"

namespace Kdd
{

void logFault(const char* function, const std::exception* fault) noexcept
{
    try {
        const std::string reason = fault != nullptr ? textForLog(*fault) : "unknown fault";
        LogFile::write(LogFile::Severity::Error, std::string(function) + ": " + reason);
    } catch (...) {
        // Without memory even for a line there is nobody left to tell; the caller has the result.
        return;
    }
}

bool isGiven(const char* function, const char* name, const void* argument)
{
    if (argument == nullptr)
        LogFile::errorf("%s: %s must not be null", function, name);
    return argument != nullptr;
}

bool isCount(const char* function, const char* name, int value)
{
    if (value < 0)
        LogFile::errorf("%s: %s must not be negative, is %d", function, name, value);
    return value >= 0;
}

}  // namespace Kdd
