#pragma once

#include "platform/base/Export.h"
#include "platform/base/Result.h"
#include "platform/volumefile/OrlanMesh.h"

#include <QByteArray>
#include <QVector>

#include <memory>

namespace Kdd
{

/// Writes a volume file, slice by slice. The file appears under its name when `finish` returns success; until then, and
/// when the writer goes before, nothing of it is to be seen. Used by one thread at a time; several objects may be
/// used on several threads.
class KDD_EXPORT OrlanMeshWriter
{
public:
    /// Begins a file with the lattice "Level0" of three dimensions. Null, and `result` says why, when the file cannot
    /// be made. The folder must exist.
    static std::unique_ptr<OrlanMeshWriter> create(const QByteArray& path, const Lattice& lattice,
                                                   Result& result);

    ~OrlanMeshWriter();
    OrlanMeshWriter(const OrlanMeshWriter&) = delete;
    OrlanMeshWriter& operator=(const OrlanMeshWriter&) = delete;

    /// Slices may come in any order. Failure when size, type or components are not those of the lattice.
    Result writeSlice(int slice, const TypedData2D& pixels);

    Result writeParameters(const ParamBundle& parameters);
    Result writeDataSection(const QByteArray& name, const QVector<quint64>& counts);

    Result finish();

private:
    struct Private;
    explicit OrlanMeshWriter(std::unique_ptr<Private> opened);

    std::unique_ptr<Private> mPrivate;
};

}  // namespace Kdd
