#pragma once

#include "platform/base/Export.h"
#include "platform/base/Geometry.h"
#include "platform/base/Result.h"
#include "platform/base/TypedData2D.h"
#include "platform/volumefile/ParamBundle.h"

#include <QByteArray>
#include <QVector>

#include <memory>

namespace Kdd
{

/// A grid of numbers in a volume file.
struct Lattice
{
    QByteArray name;    ///< "Level0" is the volume at full resolution
    QVector<int> dims;  ///< columns, rows, slices
    PrimitiveType type = PrimitiveType::UInt8;
    int components = 1;
};

/// A volume file, open for reading: one volume as an HDF5 file of our own layout, docs/volume-file-format.md.
///
/// Opening reads the header alone: parameters, and what lattices and data sections there are. Pixels are read slice by
/// slice. Nothing in the file is trusted; what is damaged gives a failure that names the file and the fault.
///
/// Used by one thread at a time; several objects may be used on several threads.
class KDD_EXPORT OrlanMesh
{
public:
    /// Null, and `result` says why, when the file cannot be opened or is no volume file.
    static std::unique_ptr<OrlanMesh> read(const QByteArray& path, Result& result);

    /// The same from the bytes of a whole file, which stay shared and are not copied. `name` stands for the path in
    /// messages.
    static std::unique_ptr<OrlanMesh> read(const QByteArray& bytes, const QByteArray& name, Result& result);

    /// Whether the file begins like a volume file; one short read.
    static bool isVolumeFile(const QByteArray& path);

    ~OrlanMesh();
    OrlanMesh(const OrlanMesh&) = delete;
    OrlanMesh& operator=(const OrlanMesh&) = delete;

    const QByteArray& name() const;

    /// The parameters of the file; the bundles "DICOM" (attributes of the series and of its first image as
    /// "Ggggg-eeee", each "VR:value") and "SOPInstanceUIDs" are below them.
    const ParamBundle& parameters() const;

    const QVector<Lattice>& lattices() const;

    /// The first lattice whose name begins with `prefix` and that has `numDims` dimensions; null when there is none.
    /// Valid as long as the mesh.
    const Lattice* findLattice(const QByteArray& prefix, int numDims) const;

    /// One slice, at full resolution, without reading the others.
    Result readSlice(const Lattice& lattice, int slice, TypedData2D& pixels) const;

    bool hasDataSection(const QByteArray& name) const;

    /// The counts of a one-dimensional data section such as "Histogram".
    Result readDataSection(const QByteArray& name, QVector<quint64>& counts) const;

private:
    struct Private;
    explicit OrlanMesh(std::unique_ptr<Private> opened);

    std::unique_ptr<Private> mPrivate;
};

}  // namespace Kdd
