#pragma once

#include "platform/volumefile/OrlanMesh.h"
#include "platform/volumefile/OrlanMeshWriter.h"
#include "support/FileContent.h"

namespace Kdd
{

/// A lattice of a few slices of 20 x 10 pixels.
Lattice aLattice(PrimitiveType type = PrimitiveType::UInt16, int components = 1, int slices = 3);

/// Pixels that tell slices apart and do not compress well.
TypedData2D sliceOf(const Lattice& lattice, int slice);

/// Volume files in a folder of their own.
class VolumeFileBuilder
{
public:
    QByteArray path() const { return mFolder.filePath(QStringLiteral("a.vol")).toUtf8(); }
    QStringList files() const;

    /// All slices, the parameters and a histogram, at `path()`; what the writer answered.
    Result write(const Lattice& lattice, const ParamBundle& parameters = {}) const;

    QByteArray bytes() const { return fileContent(QString::fromUtf8(path())); }

    /// What was written, from its file or from its bytes; a test that cannot have it fails by an exception.
    std::unique_ptr<OrlanMesh> open() const;
    std::unique_ptr<OrlanMesh> openInMemory() const;

private:
    QTemporaryDir mFolder;
};

}  // namespace Kdd
