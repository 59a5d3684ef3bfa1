#include "platform/volumefile/FileDriver.h"

#include "platform/volumefile/hdf5/OwnTypes.h"

#include <algorithm>
#include <iterator>
#include <limits>

namespace Kdd::VolumeFile
{
namespace
{

/// A store as the library sees an open file.
/// The library keeps its own data at the head of it.
struct OpenStore
{
    H5FD_t library;
    ByteStore* store;
    haddr_t end;  // of what the library has given out
};

OpenStore& opened(H5FD_t* file)
{
    return *reinterpret_cast<OpenStore*>(file);
}

const OpenStore& opened(const H5FD_t* file)
{
    return *reinterpret_cast<const OpenStore*>(file);
}

/// What the library takes for done and for failed.
herr_t answer(bool isDone)
{
    return isDone ? 0 : -1;
}

// The name and the flags mean nothing: the store was opened before and comes with the properties.
H5FD_t* open(const char* /*name*/, unsigned /*flags*/, hid_t access, haddr_t /*most*/)
{
    const auto* store = static_cast<ByteStore* const*>(H5Pget_driver_info(access));
    return store == nullptr ? nullptr : &(new OpenStore{{}, *store, 0})->library;
}

herr_t close(H5FD_t* file)
{
    delete &opened(file);
    return 0;
}

/// Not that metadata be gathered before they are read or written, as the library's own drivers ask: a length that a
/// file claims is then copied from memory unchecked, while read() below holds it against the file.
herr_t query(const H5FD_t* /*file*/, unsigned long* features)
{
    *features = H5FD_FEAT_AGGREGATE_METADATA | H5FD_FEAT_DATA_SIEVE | H5FD_FEAT_AGGREGATE_SMALLDATA |
                H5FD_FEAT_DEFAULT_VFD_COMPATIBLE;
    return 0;
}

haddr_t end(const H5FD_t* file, H5FD_mem_t /*kind*/)
{
    return opened(file).end;
}

herr_t setEnd(H5FD_t* file, H5FD_mem_t /*kind*/, haddr_t end)
{
    opened(file).end = end;
    return 0;
}

haddr_t fileEnd(const H5FD_t* file, H5FD_mem_t /*kind*/)
{
    return static_cast<haddr_t>(opened(file).store->size());
}

herr_t read(H5FD_t* file, H5FD_mem_t /*kind*/, hid_t /*properties*/, haddr_t at, size_t size, void* bytes)
{
    return answer(opened(file).store->read(static_cast<qint64>(at), bytes, size));
}

herr_t write(H5FD_t* file, H5FD_mem_t /*kind*/, hid_t /*properties*/, haddr_t at, size_t size,
             const void* bytes)
{
    return answer(opened(file).store->write(static_cast<qint64>(at), bytes, size));
}

herr_t truncate(H5FD_t* file, hid_t /*properties*/, hbool_t /*closing*/)
{
    const OpenStore& own = opened(file);
    // The library gives out room ahead of its writing, and the file must end where it was given out last.
    const auto end = static_cast<qint64>(own.end);
    return answer(end == own.store->size() || own.store->truncate(end));
}

H5FD_class_t driverClass()
{
    H5FD_class_t driver = {};
    driver.name = "store";
    driver.maxaddr = static_cast<haddr_t>(std::numeric_limits<qint64>::max());
    driver.fc_degree = H5F_CLOSE_WEAK;
    driver.fapl_size = sizeof(void*);  // the store
    driver.open = open;
    driver.close = close;
    driver.query = query;
    driver.get_eoa = end;
    driver.set_eoa = setEnd;
    driver.get_eof = fileEnd;
    driver.read = read;
    driver.write = write;
    driver.truncate = truncate;
    constexpr H5FD_mem_t kFreeSpace[] = H5FD_FLMAP_DICHOTOMY;
    std::copy(std::begin(kFreeSpace), std::end(kFreeSpace), driver.fl_map);
    return driver;
}

}  // namespace

Handle accessTo(ByteStore& store)
{
    static const H5FD_class_t sClass = driverClass();
    // Registered once for the process, since the library keeps it until it ends.
    static const hid_t sDriver = H5FDregister(&sClass);
    Handle access(H5Pcreate(ownType(OwnType::FileAccess)), H5Pclose);
    ByteStore* const info = &store;
    H5Pset_driver(access.id(), sDriver, &info);
    return access;
}

}  // namespace Kdd::VolumeFile
