#include "platform/volumefile/VolumeFileFormat.h"

#include "platform/volumefile/hdf5/OwnTypes.h"

namespace Kdd::VolumeFile
{

hid_t fileType(PrimitiveType type)
{
    switch (type) {
    case PrimitiveType::UInt8:
        return ownType(OwnType::UInt8);
    case PrimitiveType::Int8:
        return ownType(OwnType::Int8);
    case PrimitiveType::UInt16:
        return ownType(OwnType::UInt16);
    case PrimitiveType::Int16:
        return ownType(OwnType::Int16);
    case PrimitiveType::Int32:
        return ownType(OwnType::Int32);
    case PrimitiveType::UInt32:
        return ownType(OwnType::UInt32);
    case PrimitiveType::Float64:
        return ownType(OwnType::Float64);
    case PrimitiveType::Float32:
        return ownType(OwnType::Float32);
    }
    return H5I_INVALID_HID;
}

std::optional<PrimitiveType> findPrimitiveType(hid_t type)
{
    // The codes are numbered without a gap, and sizeOf is 0 behind the last one.
    for (int code = 0; sizeOf(static_cast<PrimitiveType>(code)) > 0; ++code) {
        const auto candidate = static_cast<PrimitiveType>(code);
        // Byte order, sign and size: all of it must be as in one of ours.
        if (H5Tequal(type, fileType(candidate)) > 0)
            return candidate;
    }
    return {};
}

bool isName(const QByteArray& name)
{
    // A slash separates the steps of a path, and "." is the group itself.
    return !name.isEmpty() && name.size() <= kMaxNameLength && name != "." && !name.contains('/') &&
           !name.contains('\0');
}

}  // namespace Kdd::VolumeFile
