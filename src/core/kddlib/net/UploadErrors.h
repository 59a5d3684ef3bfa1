#pragma once

#include "platform/base/Export.h"

#include <stdexcept>

namespace Kdd
{

/// An upload was given up because one of its steps failed too often.
class KDD_EXPORT RetryPolicyExhaustedError : public std::runtime_error
{
public:
    using std::runtime_error::runtime_error;
};

/// The cloud storage said something after which there is no use in going on with an upload.
class KDD_EXPORT UnrecoverableResponseError : public std::runtime_error
{
public:
    using std::runtime_error::runtime_error;
};

}  // namespace Kdd
