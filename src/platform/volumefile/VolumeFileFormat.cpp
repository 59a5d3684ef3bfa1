#include "platform/volumefile/VolumeFileFormat.h"

namespace Kdd::VolumeFile
{

hid_t fileType(PrimitiveType type)
{
    switch (type) {
    case PrimitiveType::UInt8:
        return H5T_STD_U8LE;
    case PrimitiveType::Int8:
        return H5T_STD_I8LE;
    case PrimitiveType::UInt16:
        return H5T_STD_U16LE;
    case PrimitiveType::Int16:
        return H5T_STD_I16LE;
    case PrimitiveType::Int32:
        return H5T_STD_I32LE;
    case PrimitiveType::UInt32:
        return H5T_STD_U32LE;
    case PrimitiveType::Float64:
        return H5T_IEEE_F64LE;
    case PrimitiveType::Float32:
        return H5T_IEEE_F32LE;
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
