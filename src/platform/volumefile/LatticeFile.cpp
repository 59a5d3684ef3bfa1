#include "platform/volumefile/LatticeFile.h"

#include "platform/volumefile/ParameterFile.h"
#include "platform/volumefile/VolumeFileFormat.h"

#include <algorithm>

namespace Kdd::VolumeFile
{
namespace
{

/// The number of components, and whether they have a dimension of their own.
Result readComponents(const ChunkedData& data, int& components, bool& haveDimension)
{
    // Without the attribute the last dimension is that of the columns.
    haveDimension = H5Aexists(data.object(), kComponentsAttribute) > 0;
    if (!haveDimension)
        return {};
    ParameterBudget budget;
    Parameter parameter;
    Result read = readAttribute(data.object(), kComponentsAttribute, budget, parameter);
    if (read.bad())
        return read;
    const qint64 count = parameter.integers.value(0);
    // They are the last dimension, so the number stands there twice and must agree.
    if (count < 1 || count > kMaxComponents || static_cast<hsize_t>(count) != data.dims().last())
        return Result::failure(QStringLiteral("has a wrong number of components"));
    components = static_cast<int>(count);
    return {};
}

Result checkLattice(const Lattice& lattice)
{
    const auto isDim = [](int dim) { return dim > 0 && dim <= kMaxDimension; };
    if (lattice.dims.size() != 3 || !std::all_of(lattice.dims.begin(), lattice.dims.end(), isDim))
        return Result::failure(
            QStringLiteral("the lattice has not three dimensions from 1 to %1").arg(kMaxDimension));
    if (lattice.components < 1 || lattice.components > kMaxComponents || sizeOf(lattice.type) == 0)
        return Result::failure(QStringLiteral("the lattice has pixels of an unknown type"));
    return {};
}

}  // namespace

Result openLattice(hid_t group, const QByteArray& name, ChunkedData& data, Lattice& lattice)
{
    lattice.name = name;
    Result opened = data.open(group, name);
    if (opened.bad())
        return opened;
    const std::optional<PrimitiveType> type = findPrimitiveType(data.type());
    if (!type)
        return Result::failure(QStringLiteral("has pixels of an unknown type"));
    lattice.type = *type;
    bool haveDimension = false;
    Result read = readComponents(data, lattice.components, haveDimension);
    if (read.bad())
        return read;
    const int numDims = data.dims().size() - (haveDimension ? 1 : 0);
    if (numDims < kMinLatticeDims || numDims > kMaxLatticeDims)
        return Result::failure(QStringLiteral("has %1 dimensions").arg(numDims));
    // A chunk is a slice: rows, columns and components are whole in it.
    for (int i = 0; i < data.dims().size(); ++i) {
        const hsize_t dim = data.dims().at(i);
        if (dim < 1 || dim > kMaxDimension || data.chunk().at(i) != (i < numDims - 2 ? 1 : dim))
            return Result::failure(
                QStringLiteral("dimension %1 is %2 in chunks of %3").arg(i).arg(dim).arg(data.chunk().at(i)));
    }
    // The file has the slowest dimension first, the lattice the fastest.
    for (int i = numDims - 1; i >= 0; --i)
        lattice.dims.append(static_cast<int>(data.dims().at(i)));
    return {};
}

Result createLattice(hid_t group, const Lattice& lattice, ChunkedData& data)
{
    Result result = checkLattice(lattice);
    if (result.bad())
        return result;
    QVector<hsize_t> dims;
    for (int i = 2; i >= 0; --i)
        dims.append(static_cast<hsize_t>(lattice.dims.at(i)));
    // Grey pixels have no dimension for components.
    if (lattice.components > 1)
        dims.append(static_cast<hsize_t>(lattice.components));
    QVector<hsize_t> chunk = dims;
    // One slice, so that a slice is read without the others.
    chunk.first() = 1;
    result = data.create(group, lattice.name, fileType(lattice.type), dims, chunk);
    if (result.good() && lattice.components > 1)
        result =
            writeAttribute(data.object(), kComponentsAttribute, Parameter::ofIntegers({lattice.components}));
    return result;
}

}  // namespace Kdd::VolumeFile
