#pragma once

#include "platform/base/Result.h"

namespace Kdd
{

/// Libraries that are loaded when something of them is first called, because a program that only reads tag files needs
/// none of them and would spend most of its start on them.
///
/// They are called as any other: what the code calls of them is made by the build, each function a jump to where it lies,
/// and the first one loads the library, by a module of ours that links it. No variable of such a library can be used.
enum class LateLibrary {
    Codecs,      ///< JPEG, JPEG-LS and JPEG 2000
    Curl,        ///< and the cryptography below it
    Database,    ///< Qt's access to databases; it loads drivers itself
    Pictures,    ///< Qt's pictures
    Postgresql,  ///< the client library itself
    VolumeFiles  ///< HDF5
};

/// Loads the library, unless that was done before; failure, which names the module, when it is not there. To be asked
/// where a failure can be told as what it is: a call that nobody asked for throws std::runtime_error instead.
///
/// On any thread. What is missing stays missing for the life of the process.
Result loadLate(LateLibrary library);

}  // namespace Kdd
