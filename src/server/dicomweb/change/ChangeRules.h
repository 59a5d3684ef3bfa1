#pragma once

#include <chrono>

namespace Kdd::DicomWeb
{

/// What clients may change beside sending objects, and how.
struct ChangeRules
{
    bool corrections = false;  ///< are taken
    bool deletions = false;    ///< are done
    int most = 1;              ///< at a time

    /// For so long a request waits for others that work on the study. A large study can take longer to be built; then
    /// whoever sent it comes again.
    std::chrono::milliseconds patience{10000};

    int patienceMs() const { return static_cast<int>(patience.count()); }
};

}  // namespace Kdd::DicomWeb
