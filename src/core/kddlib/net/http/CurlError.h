#pragma once

#include "platform/base/Export.h"

#include <exception>
#include <string>

namespace Kdd
{

/// A request that could not be set up or carried out. A value; thrown on the thread that asked.
class KDD_EXPORT CurlError : public std::exception
{
public:
    /// `code` is the CURLcode, `description` what curl wrote into the request's error buffer, if anything.
    explicit CurlError(int code, const char* description = nullptr);

    /// "Error code: " and curl's text for the code; on a line of its own "Error description: " and the description
    /// when there is one; and, when the two sides have no cipher in common, a line with the cure.
    const char* what() const noexcept override { return mMessage.c_str(); }

    /// That last line; empty for other codes.
    static std::string cureFor(int code);

private:
    std::string mMessage;
};

/// An error's text as `LogFile::write` takes it: the line ends are those of a CurlError, all else is escaped.
KDD_EXPORT std::string textForLog(const std::exception& error);

}  // namespace Kdd
