#pragma once

#include "platform/late/LateLibrary.h"

#include <cstddef>

namespace Kdd
{

/// What the build knows of a library that is loaded late.
struct LateTable
{
    LateLibrary library;
    const char* file;  ///< its module
    const char*
        digest;  ///< of the names of its functions, by which library and module know that they are of one build
    std::size_t first;  ///< where the addresses of its functions begin in kddLateCalls
    std::size_t count;
};

/// Empty where the libraries are linked.
extern const LateTable* const kLateTables;
extern const std::size_t kLateTableCount;

/// The only thing that a module shows, by this name.
constexpr char kLateModule[] = "kddLateModule";

struct LateModule
{
    const char* digest;
    void* const* functions;  ///< in the order of the names
};

}  // namespace Kdd

/// The functions' addresses, null until their library is loaded: the jumps read them.
extern "C" void* kddLateCalls[];  // NOLINT(modernize-avoid-c-arrays): shared with assembly
