#pragma once

namespace Kdd
{

/// The creator of our own private attributes, all in group 0071.
constexpr const char* kOurPrivateCreator = "Korvex";

}  // namespace Kdd
