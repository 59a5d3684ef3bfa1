#include "platform/os/SystemLog.h"

#include <syslog.h>

#include <algorithm>

namespace Kdd
{

namespace
{

int priorityOf(LogFile::Severity severity)
{
    switch (severity) {
    case LogFile::Severity::Error:
        return LOG_ERR;
    case LogFile::Severity::Warning:
        return LOG_WARNING;
    case LogFile::Severity::Information:
        return LOG_INFO;
    case LogFile::Severity::Trace:
        break;
    }
    return LOG_DEBUG;
}

}  // namespace

void writeToSystemLog(LogFile::Severity severity, const char* category, const std::string& line)
{
    // Before each line, since the system's log may put others between them.
    const std::string prefix = *category != '\0' ? std::string("[") + category + "] " : std::string();
    // Line by line: the system's log would write a line feed as a number, and all in one line.
    for (std::size_t start = 0; start <= line.size();) {
        const std::size_t end = std::min(line.find('\n', start), line.size());
        const std::string part = line.substr(start, end - start);
        // Never as the format itself: a line may have percent signs.
        syslog(LOG_USER | priorityOf(severity), "%s%s", prefix.c_str(), part.c_str());
        start = end + 1;
    }
}

}  // namespace Kdd
