#include "platform/volumefile/VolumeFileBuilder.h"

#include <QDir>

#include <random>
#include <stdexcept>

namespace Kdd
{

namespace
{

std::unique_ptr<OrlanMesh> required(std::unique_ptr<OrlanMesh> mesh, const Result& result)
{
    return mesh != nullptr ? std::move(mesh) : throw std::runtime_error(result.text().toStdString());
}

}  // namespace

Lattice aLattice(PrimitiveType type, int components, int slices)
{
    return {"Level0", {20, 10, slices}, type, components};
}

TypedData2D sliceOf(const Lattice& lattice, int slice)
{
    TypedData2D data{lattice.dims.at(0), lattice.dims.at(1), lattice.components, lattice.type, {}};
    data.pixels.resize(static_cast<int>(data.rowStride()) * data.height);
    std::minstd_rand random(static_cast<unsigned>(slice + 1));
    for (char& byte : data.pixels)
        byte = static_cast<char>(random());
    return data;
}

QStringList VolumeFileBuilder::files() const
{
    return QDir(mFolder.path()).entryList(QDir::Files | QDir::Hidden);
}

Result VolumeFileBuilder::write(const Lattice& lattice, const ParamBundle& parameters) const
{
    Result result;
    const auto writer = OrlanMeshWriter::create(path(), lattice, result);
    for (int i = lattice.dims.at(2) - 1; i >= 0 && result.good(); --i)
        result = writer->writeSlice(i, sliceOf(lattice, i));
    if (result.good())
        result = writer->writeParameters(parameters);
    if (result.good())
        result = writer->writeDataSection("Histogram", {1, 0, ~quint64(0)});
    return result.good() ? writer->finish() : result;
}

std::unique_ptr<OrlanMesh> VolumeFileBuilder::open() const
{
    Result result;
    return required(OrlanMesh::read(path(), result), result);
}

std::unique_ptr<OrlanMesh> VolumeFileBuilder::openInMemory() const
{
    Result result;
    return required(OrlanMesh::read(bytes(), "memory", result), result);
}

}  // namespace Kdd
