#pragma once

#include "platform/base/LogFile.h"

#include <string>

namespace Kdd
{

/// Hands a line to the log of the operating system (syslog, facility "user"), a category in brackets before it; a text with
/// line feeds as several lines. In the
/// form that `LogFile::setCallback` takes; may be called on any thread. Which program it comes from and where it ends up
/// is for the process and the system to say: neither is set here.
void writeToSystemLog(LogFile::Severity severity, const char* category, const std::string& line);

}  // namespace Kdd
