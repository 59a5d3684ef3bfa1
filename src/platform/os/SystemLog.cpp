#include "platform/os/SystemLog.h"

#include <syslog.h>

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
    const std::string prefix = *category != '\0' ? std::string("[") + category + "] " : std::string();
    syslog(LOG_USER | priorityOf(severity), "%s%s", prefix.c_str(), line.c_str());
}

}  // namespace Kdd
