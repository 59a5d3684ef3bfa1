#pragma once

#include "platform/base/Result.h"

#include <system_error>

namespace Kdd
{

/// A failure with the system's own words for an `errno`. Those of `strerror` may be another thread's by the time they are
/// read.
inline Result systemFailure(int error)
{
    return Result::failure(QString::fromLocal8Bit(std::system_category().message(error).c_str()));
}

}  // namespace Kdd
