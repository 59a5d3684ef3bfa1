#pragma once

namespace Kdd
{

/// What becomes of a question for something that is not there: it fails, or makes it.
enum class IfAbsent { Fail, Create };

}  // namespace Kdd
