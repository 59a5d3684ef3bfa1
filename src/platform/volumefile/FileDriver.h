#pragma once

#include "platform/volumefile/Hdf5.h"

#include <QtGlobal>

#include <cstddef>

namespace Kdd::VolumeFile
{

/// Where the bytes of a volume file are: in a file that is read or written, or in memory.
class ByteStore
{
public:
    ByteStore() = default;
    virtual ~ByteStore() = default;
    ByteStore(const ByteStore&) = delete;
    ByteStore& operator=(const ByteStore&) = delete;

    /// [bytes]
    virtual qint64 size() const = 0;

    /// The three below return false on failure.
    virtual bool read(qint64 at, void* bytes, std::size_t size) = 0;
    virtual bool write(qint64 at, const void* bytes, std::size_t size) = 0;
    virtual bool truncate(qint64 size) = 0;
};

/// The properties with which H5Fopen and H5Fcreate use `store`, whatever the name they are given. The store must outlive
/// what is made with them. A store that is opened twice is two files to the library.
Handle accessTo(ByteStore& store);

}  // namespace Kdd::VolumeFile
