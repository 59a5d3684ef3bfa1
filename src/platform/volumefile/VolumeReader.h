#pragma once

#include "platform/base/Result.h"
#include "platform/volumefile/FileDriver.h"
#include "platform/volumefile/OrlanMesh.h"
#include "platform/volumefile/ParamBundle.h"

#include <QByteArray>
#include <QVector>

#include <memory>

namespace Kdd
{

class DecoderPool;

namespace VolumeFile
{

/// What a volume file tells of itself without its pixels.
struct VolumeHeader
{
    ParamBundle parameters;
    QVector<Lattice> lattices;
    QVector<QByteArray> dataSections;  ///< names
};

/// A volume file that is open. One thread at a time.
class VolumeReader
{
public:
    VolumeReader() = default;
    virtual ~VolumeReader() = default;
    VolumeReader(const VolumeReader&) = delete;
    VolumeReader& operator=(const VolumeReader&) = delete;

    const VolumeHeader& header() const { return mHeader; }

    /// The pixels of a slice of the lattice at that place in the header, which has three dimensions and such a slice.
    virtual Result readSlice(int lattice, int slice, QByteArray& bytes) = 0;

    /// The counts of a data section that is there.
    virtual Result readCounts(const QByteArray& section, QVector<quint64>& counts) = 0;

protected:
    VolumeHeader mHeader;
};

/// Reads by the library, in this process. Null, and `result` says why, when it is no volume file. `name` is for messages.
std::unique_ptr<VolumeReader> openInside(std::unique_ptr<ByteStore> store, const QByteArray& name,
                                         Result& result);

/// Has a decoder of `pool` read what only the library can read, and reads slices and counts itself.
std::unique_ptr<VolumeReader> openApart(DecoderPool& pool, std::unique_ptr<ByteStore> store,
                                        const QByteArray& name, Result& result);

}  // namespace VolumeFile

}  // namespace Kdd
