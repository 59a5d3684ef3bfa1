#pragma once

#include "platform/base/Result.h"
#include "platform/volumefile/ChunkedData.h"
#include "platform/volumefile/OrlanMesh.h"

#include <hdf5.h>

// Lattices as a volume file keeps them: a dataset whose chunks are the slices.
namespace Kdd::VolumeFile
{

/// Opens the lattice of that name and says what it is; no pixels are read.
Result openLattice(hid_t group, const QByteArray& name, ChunkedData& data, Lattice& lattice);

/// Makes an empty one of three dimensions.
Result createLattice(hid_t group, const Lattice& lattice, ChunkedData& data);

}  // namespace Kdd::VolumeFile
