#pragma once

#include "platform/base/Stopwatch.h"

#include <curl/curl.h>

#include <cstddef>
#include <exception>
#include <optional>
#include <string>
#include <string_view>

namespace Kdd
{

struct KxHttpStatus;

/// Carries an exception across curl, through whose frames none may pass: a callback runs its work here, and after the
/// transfer the caller rethrows what came of it.
class CallbackFault
{
public:
    /// `length` when `work` came to its end, else 0, which is never the length and makes curl break the transfer off.
    template <typename Work>
    std::size_t guard(std::size_t length, Work work) noexcept
    {
        try {
            work();
            return length;
        } catch (...) {
            mFault = std::current_exception();
            return 0;
        }
    }

    void rethrow() const
    {
        if (mFault)
            std::rethrow_exception(mFault);
    }

private:
    std::exception_ptr mFault;
};

/// A header of a response.
struct HeaderLine
{
    std::string name;        // in lower case
    std::string_view value;  // part of the line it was parsed from

    /// A line with its line end; one without a colon is a name with an empty value. Nothing when the line end is
    /// missing or there is nothing before it.
    static std::optional<HeaderLine> parse(std::string_view line);
};

/// Takes the header lines of one response into a status, for every kind of request. Time is counted from its making. Curl
/// itself ends a response whose headers exceed 300 KiB.
class HeaderReceiver
{
public:
    /// Keeps both, which must outlive it.
    HeaderReceiver(KxHttpStatus& status, CallbackFault& fault)
        : mStatus(status)
        , mFault(fault)
    {
    }

    /// Makes the handle call this object, which then must outlive the transfer. CurlError when curl refuses.
    void attach(CURL* easy);

private:
    static std::size_t receive(char* bytes, std::size_t size, std::size_t count, void* receiver);
    void takeLine(std::string_view line);
    void takeCode();

    KxHttpStatus& mStatus;
    CallbackFault& mFault;
    CURL* mEasy = nullptr;
    Stopwatch mSinceStart;
    bool mStarted = false;
};

}  // namespace Kdd
