#pragma once

#include <cstdint>

// What the library and the module with the video decoders say to each other: one function and one plain structure, so
// that neither needs the other's headers, run time or memory.

namespace Kdd
{

/// Raised with every change of the structure; a module of another version refuses to work.
constexpr std::int32_t kVideoModuleVersion = 1;

/// The module's only function, by this name.
constexpr char kVideoModuleEntry[] = "kddDecodeVideoFrame";

/// The module's file.
constexpr char kVideoModuleFile[] = "kdd-video.so";

/// One frame is wanted. The caller owns everything; the callbacks are called only during the call, on its thread, and
/// must not throw.
struct VideoRequest
{
    std::int32_t version = kVideoModuleVersion;

    std::int32_t width = 0;   ///< the frame is reduced to fit [pixels], above 0
    std::int32_t height = 0;  ///< likewise
    double fraction = 0;      ///< of the duration, 0 to 1

    void* source = nullptr;
    std::int64_t size = 0;  ///< of the source [bytes]

    /// Up to `length` bytes from `offset` into `out`; how many, 0 at the end, -1 on failure.
    std::int64_t (*read)(void* source, std::int64_t offset, void* out, std::int64_t length) = nullptr;

    void* target = nullptr;

    /// Called at most once, when the frame is there: room for width * height * 3 bytes (red, green, blue, rows from
    /// top to bottom without padding), or null.
    unsigned char* (*allocate)(void* target, std::int32_t width, std::int32_t height) = nullptr;

    /// Why there is no frame; ends with a zero.
    char reason[160] = {};
};

/// 1 when the frame is in the room that was allocated, else 0 with the reason.
using VideoModuleEntry = std::int32_t (*)(VideoRequest* request);

}  // namespace Kdd
