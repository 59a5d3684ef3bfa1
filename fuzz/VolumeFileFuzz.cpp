// What is accepted of a volume file is consistent: lattices and slices agree, nothing exceeds what its type can hold.

#include "fuzz/Property.h"
#include "platform/volumefile/OrlanMesh.h"
#include "platform/volumefile/SOPInstanceUtility.h"

using namespace Kdd;

// The HDF5 library loses some memory with every damaged object header.
extern "C" __attribute__((visibility("default"))) const char* __lsan_default_suppressions()
{
    return "leak:libhdf5";
}

namespace
{

/// Larger lattices would take all the time.
constexpr int kMaxSlices = 16;
constexpr qint64 kMaxSliceBytes = 1024 * 1024;

void checkLattice(const OrlanMesh& mesh, const Lattice& lattice)
{
    for (const int dim : lattice.dims)
        require(dim > 0, "every dimension is positive");
    require(sizeOf(lattice.type) > 0 && lattice.components > 0, "pixels have a size");
    if (lattice.dims.size() != 3)
        return;
    const qint64 sliceBytes =
        qint64(lattice.dims.at(0)) * lattice.dims.at(1) * lattice.components * sizeOf(lattice.type);
    if (sliceBytes > kMaxSliceBytes)
        return;
    for (int i = 0; i < qMin(lattice.dims.at(2), kMaxSlices); ++i) {
        TypedData2D pixels;
        if (mesh.readSlice(lattice, i, pixels).good())
            require(pixels.pixels.size() == sliceBytes, "a slice is as large as its lattice says");
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, std::size_t size)
{
    Result result;
    const auto mesh = OrlanMesh::read(bytesOf(data, size), "fuzzed", result);
    require(result.good() == (mesh != nullptr), "a refusal has a reason");
    if (!mesh)
        return 0;
    for (const Lattice& lattice : mesh->lattices())
        checkLattice(*mesh, lattice);
    SOPInstanceUtility::sopUIDList(mesh->parameters().bundle("SOPInstanceUIDs"));
    QVector<quint64> counts;
    if (mesh->readDataSection("Histogram", counts).good())
        require(mesh->hasDataSection("Histogram") && !counts.isEmpty(), "counts that were read are there");
    return 0;
}
