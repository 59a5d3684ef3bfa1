#include "platform/base/LogFile.h"

#include <spdlog/sinks/rotating_file_sink.h>
#include <spdlog/sinks/stdout_color_sinks.h>
#include <spdlog/spdlog.h>

#include <algorithm>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <mutex>
#include <vector>

namespace Kdd
{

namespace
{

// So the files take 40 MiB at most.
constexpr std::size_t kRotatedSize = 10 * 1024 * 1024;
constexpr std::size_t kRotatedFiles = 3;

struct Settings
{
    LogFile::Level level = LogFile::Level::Information;
    LogFile::Severity least = LogFile::Severity::Trace;
    LogFile::Callback callback;
    bool isDebugWanted = false;
    std::string droppedCategory;
};

/// Read without a lock, since all of it is set before there are several threads.
Settings& settings()
{
    static Settings instance;
    return instance;
}

/// The level at which a severity begins to be written.
LogFile::Level neededLevel(LogFile::Severity severity)
{
    switch (severity) {
    case LogFile::Severity::Error:
        return LogFile::Level::Errors;
    case LogFile::Severity::Warning:
        return LogFile::Level::Warnings;
    case LogFile::Severity::Information:
        return LogFile::Level::Information;
    case LogFile::Severity::Trace:
        break;
    }
    return LogFile::Level::Everything;
}

LogFile::Severity severityOfTrace(int level)
{
    switch (level) {
    case 3:
        return LogFile::Severity::Error;
    case 2:
        return LogFile::Severity::Warning;
    case 1:
        return LogFile::Severity::Information;
    default:
        return LogFile::Severity::Trace;
    }
}

spdlog::level::level_enum spdlogLevel(LogFile::Severity severity)
{
    switch (severity) {
    case LogFile::Severity::Error:
        return spdlog::level::err;
    case LogFile::Severity::Warning:
        return spdlog::level::warn;
    case LogFile::Severity::Information:
        return spdlog::level::info;
    case LogFile::Severity::Trace:
        break;
    }
    return spdlog::level::trace;
}

/// Made when the first line is written, so that a process which logs nothing does not pay for it.
spdlog::logger& logger()
{
    static const std::shared_ptr<spdlog::logger> instance = [] {
        std::vector<spdlog::sink_ptr> sinks{std::make_shared<spdlog::sinks::stderr_color_sink_mt>()};
        std::string fault;
        if (const char* path = std::getenv("KDD_LOG_FILE"); path != nullptr && *path != '\0') {
            try {
                sinks.push_back(std::make_shared<spdlog::sinks::rotating_file_sink_mt>(path, kRotatedSize,
                                                                                       kRotatedFiles));
            } catch (const spdlog::spdlog_ex& failure) {
                // A log file that cannot be made is told on standard error. The work itself goes on.
                fault = failure.what();
            }
        }
        auto made = std::make_shared<spdlog::logger>("kdd", sinks.begin(), sinks.end());
        // Which lines are wanted is decided before they get here.
        made->set_level(spdlog::level::trace);
        made->set_pattern("%Y-%m-%d %H:%M:%S.%e %^%l%$ %v");
        // What may be the last line before a crash is not held back.
        made->flush_on(spdlog::level::warn);
        if (!fault.empty())
            made->error("The log file cannot be written: {}", fault);
        return made;
    }();
    return *instance;
}

std::string formatted(const char* format, va_list arguments)
{
    // A list of arguments can be walked once only, and is needed for the length and for the text.
    va_list again;
    va_copy(again, arguments);
    // NOLINTNEXTLINE(clang-analyzer-valist.Uninitialized): the caller has started the list
    const int length = std::vsnprintf(nullptr, 0, format, arguments);
    std::string text(length > 0 ? static_cast<std::size_t>(length) : 0, '\0');
    if (length > 0)
        std::vsnprintf(text.data(), text.size() + 1, format, again);
    va_end(again);
    return text;
}

/// Escapes all control characters but the line feeds for which `isOwn` says yes to their place.
template <typename IsOwn>
std::string escapedBut(const std::string& text, const IsOwn& isOwn)
{
    static const char* const kDigits = "0123456789abcdef";
    std::string clean;
    clean.reserve(text.size());
    for (std::size_t i = 0; i < text.size(); ++i) {
        const auto byte = static_cast<unsigned char>(text[i]);
        if ((byte >= 0x20 && byte != 0x7f) || (byte == '\n' && isOwn(i)))
            clean += text[i];
        else
            clean.append("\\x").append(1, kDigits[byte >> 4]).append(1, kDigits[byte & 15]);
    }
    return clean;
}

/// The line with its values escaped. A line feed is the format's own where another character comes out when the format
/// has that one instead: no value can make itself look like that.
std::string lineOf(const char* format, va_list arguments)
{
    const std::string original(format);
    if (original.find('\n') == std::string::npos)
        return LogFile::escaped(formatted(format, arguments));
    std::string marked = original;
    // Any character would do that is no part of a conversion.
    std::replace(marked.begin(), marked.end(), '\n', '|');
    va_list again;
    va_copy(again, arguments);
    const std::string text = formatted(format, arguments);
    const std::string other = formatted(marked.c_str(), again);
    va_end(again);
    return escapedBut(text, [&](std::size_t i) { return other.size() == text.size() && other[i] == '|'; });
}

/// Asked before a line is put together, which costs far more than the question.
bool isWanted(LogFile::Severity severity, const char* category)
{
    const Settings& current = settings();
    if (*category != '\0' && current.droppedCategory == category)
        return false;
    return (current.callback && severity >= current.least) || neededLevel(severity) <= current.level;
}

void writeLine(LogFile::Severity severity, const char* category, const std::string& line)
{
    const Settings& current = settings();
    if (current.callback && severity >= current.least)
        current.callback(severity, category, line);
    else if (*category != '\0')
        logger().log(spdlogLevel(severity), "[{}] {}", category, line);
    else
        logger().log(spdlogLevel(severity), line);
}

void writeFormatted(LogFile::Severity severity, const char* category, const char* format, va_list arguments)
{
    if (isWanted(severity, category))
        writeLine(severity, category, lineOf(format, arguments));
}

}  // namespace

void LogFile::errorf(const char* format, ...)
{
    va_list arguments;
    va_start(arguments, format);
    writeFormatted(Severity::Error, "", format, arguments);
    va_end(arguments);
}

void LogFile::warnf(const char* format, ...)
{
    va_list arguments;
    va_start(arguments, format);
    writeFormatted(Severity::Warning, "", format, arguments);
    va_end(arguments);
}

void LogFile::printf(const char* format, ...)
{
    va_list arguments;
    va_start(arguments, format);
    writeFormatted(Severity::Information, "", format, arguments);
    va_end(arguments);
}

void LogFile::tracef(int level, const char* category, const char* format, ...)
{
    va_list arguments;
    va_start(arguments, format);
    writeFormatted(severityOfTrace(level), category, format, arguments);
    va_end(arguments);
}

void LogFile::write(Severity severity, const std::string& text)
{
    if (isWanted(severity, ""))
        writeLine(severity, "", escapedBut(text, [](std::size_t /*place*/) { return true; }));
}

std::string LogFile::escaped(const std::string& text)
{
    return escapedBut(text, [](std::size_t /*place*/) { return false; });
}

void LogFile::setLevel(Level level)
{
    settings().level = level;
    // Whoever wants it otherwise says so afterwards.
    settings().isDebugWanted = level >= Level::Timing;
}

LogFile::Level LogFile::level()
{
    return settings().level;
}

bool LogFile::debugLogging()
{
    return settings().isDebugWanted;
}

void LogFile::setDebugLogging(bool isWanted)
{
    settings().isDebugWanted = isWanted;
}

void LogFile::dropTraces(const char* category)
{
    settings().droppedCategory = category;
}

void LogFile::setCallback(Callback callback, Severity least)
{
    settings().callback = std::move(callback);
    settings().least = least;
}

bool LogFile::hasCallback()
{
    return static_cast<bool>(settings().callback);
}

}  // namespace Kdd
