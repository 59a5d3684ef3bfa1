#include "platform/volumefile/hdf5/OwnTypes.h"

namespace Kdd::VolumeFile
{

hid_t ownType(OwnType type)
{
    switch (type) {
    case OwnType::Int8:
        return H5T_STD_I8LE;
    case OwnType::UInt8:
        return H5T_STD_U8LE;
    case OwnType::Int16:
        return H5T_STD_I16LE;
    case OwnType::UInt16:
        return H5T_STD_U16LE;
    case OwnType::Int32:
        return H5T_STD_I32LE;
    case OwnType::UInt32:
        return H5T_STD_U32LE;
    case OwnType::Int64:
        return H5T_STD_I64LE;
    case OwnType::UInt64:
        return H5T_STD_U64LE;
    case OwnType::Float32:
        return H5T_IEEE_F32LE;
    case OwnType::Float64:
        return H5T_IEEE_F64LE;
    case OwnType::Text:
        return H5T_C_S1;
    case OwnType::FileAccess:
        return H5P_FILE_ACCESS;
    case OwnType::DatasetCreation:
        return H5P_DATASET_CREATE;
    }
    return H5I_INVALID_HID;
}

}  // namespace Kdd::VolumeFile
