#pragma once

#include "platform/base/Export.h"

#include <stdexcept>
#include <string>
#include <utility>

namespace Kdd
{

/// An upload was given up because one of its steps failed too often. Thrown on the thread that writes.
class KDD_EXPORT RetryPolicyExhaustedError : public std::runtime_error
{
public:
    /// `message` names the step, `cause` how it failed the last time; empty when the storage just came no further.
    RetryPolicyExhaustedError(const std::string& message, std::string cause)
        : std::runtime_error(message)
        , mCause(std::move(cause))
    {
    }

    const std::string& cause() const { return mCause; }

private:
    std::string mCause;
};

/// The cloud storage said something after which there is no use in going on with an upload. Thrown on the thread that
/// writes.
class KDD_EXPORT UnrecoverableResponseError : public std::runtime_error
{
public:
    using std::runtime_error::runtime_error;
};

/// The error's text, with its cause where it has one.
inline std::string explained(const std::exception& error)
{
    const auto* const exhausted = dynamic_cast<const RetryPolicyExhaustedError*>(&error);
    const bool hasCause = exhausted && !exhausted->cause().empty();
    return hasCause ? exhausted->what() + std::string(" ") + exhausted->cause() : error.what();
}

}  // namespace Kdd
