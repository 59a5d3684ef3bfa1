#pragma once

#include <exception>

namespace Kdd
{

// What every C function needs at the border to its caller.

/// Logs why a call was given up; null: nobody knows. Never throws itself, whatever state the process is in.
void logFault(const char* function, const std::exception* fault) noexcept;

/// Runs the body of a C function with that function's name, for the log. What it throws ends here, in the log, and
/// `onFault` is the result: an exception must not run into frames of another language.
template <typename Value, typename Body>
Value guarded(const char* function, Value onFault, const Body& body) noexcept
{
    try {
        return body(function);
    } catch (const std::exception& fault) {
        logFault(function, &fault);
    } catch (...) {
        logFault(function, nullptr);
    }
    return onFault;
}

/// False, and an error line that names the argument, when a pointer is null.
bool isGiven(const char* function, const char* name, const void* argument);

/// The same when a number is negative.
bool isCount(const char* function, const char* name, int value);

/// The same for an array of `count` texts, none of which may be null.
template <typename Text>
bool areGiven(const char* function, const char* name, int count, const Text* const* texts)
{
    if (!isCount(function, "the count", count) || (count > 0 && !isGiven(function, name, texts)))
        return false;
    for (int i = 0; i < count; ++i) {
        if (!isGiven(function, name, texts[i]))
            return false;
    }
    return true;
}

}  // namespace Kdd
