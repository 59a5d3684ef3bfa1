#pragma once

#include "platform/base/Export.h"

#include <functional>
#include <string>

namespace Kdd
{

/// The process-wide log.
///
/// Lines go to standard error, coloured by severity on a terminal; when the environment variable KDD_LOG_FILE names a
/// file they go to that file as well, which is rotated at 10 MiB and kept three times. Control characters in a value
/// (they come from damaged files) are written as \xNN, so that it can never forge a line of its own; the line feeds of
/// our own formats stand.
///
/// Every function may be called on every thread. The settings are made once at start and are not locked.
class KDD_EXPORT LogFile
{
public:
    enum class Severity { Trace, Information, Warning, Error };

    /// What is written: the severity named and all above it.
    enum class Level { Nothing = 0, Errors = 1, Warnings = 2, Information = 3, Timing = 4, Everything = 5 };

    /// Receives what one call logs, without time and last line end; line feeds in it are our own. `category` is empty
    /// but for traces.
    using Callback = std::function<void(Severity severity, const char* category, const std::string& line)>;

    /// Something that the user asked for is not done.
    static void errorf(const char* format, ...) __attribute__((format(printf, 1, 2)));

    /// Done, but not as asked.
    static void warnf(const char* format, ...) __attribute__((format(printf, 1, 2)));

    /// What an operator wants to see.
    static void printf(const char* format, ...) __attribute__((format(printf, 1, 2)));

    /// For us. `level` ranks the line: 3 is written like an error, 2 like a warning, 1 like information and 0 only
    /// when everything is written. `category` names the subsystem ("TagFile", "TagMerge", "kdd", ...).
    static void tracef(int level, const char* category, const char* format, ...)
        __attribute__((format(printf, 3, 4)));

    /// A text that was put together before: it may have line feeds of our own, while all that comes from outside went
    /// through `escaped`.
    static void write(Severity severity, const std::string& text);

    /// A text from outside, with its control characters as \xNN.
    static std::string escaped(const std::string& text);

    /// Debug logging goes with Timing and above, until it is set otherwise.
    static void setLevel(Level level);
    static Level level();

    /// Whether lines are wanted that only help to find faults: how long something took, which files are not there.
    static bool debugLogging();
    static void setDebugLogging(bool isWanted);

    /// Traces of the category are not written from now on, because the process tells their subject otherwise.
    static void dropTraces(const char* category);

    /// Hands every line of `least` and above to `callback` instead of writing it; an empty callback ends that.
    static void setCallback(Callback callback, Severity least = Severity::Trace);
    static bool hasCallback();
};

}  // namespace Kdd
