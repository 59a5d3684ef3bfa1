#pragma once

#include <hdf5.h>

namespace Kdd::VolumeFile
{

/// What the library has ready: types, all of them little-endian, and the kinds of property lists. It keeps them in
/// variables, and those that load it late see functions only.
enum class OwnType {
    Int8,
    UInt8,
    Int16,
    UInt16,
    Int32,
    UInt32,
    Int64,
    UInt64,
    Float32,
    Float64,
    Text,  ///< of single bytes
    FileAccess,
    DatasetCreation
};

/// Owned by the library.
hid_t ownType(OwnType type);

}  // namespace Kdd::VolumeFile
