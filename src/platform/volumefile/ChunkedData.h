#pragma once

#include "platform/base/Result.h"
#include "platform/volumefile/ChunkCoding.h"
#include "platform/volumefile/Hdf5.h"

#include <QByteArray>
#include <QVector>

namespace Kdd::VolumeFile
{

/// A dataset that is kept in compressed chunks of equal size. Nothing else of what the library offers is accepted,
/// because the rest reads other files, loads modules, or has no checksum.
class ChunkedData
{
public:
    /// Opens a dataset of numbers or fixed-length texts, and checks its shape; no chunk is read.
    Result open(hid_t group, const QByteArray& name);

    Result create(hid_t group, const QByteArray& name, hid_t type, const QVector<hsize_t>& dims,
                  const QVector<hsize_t>& chunk);

    bool isOpen() const { return mDataset.isOpen(); }
    hid_t object() const { return mDataset.id(); }
    hid_t type() const { return mType.id(); }

    /// The slowest dimension first; as many as `dims` are there in `chunk`.
    const QVector<hsize_t>& dims() const { return mDims; }
    const QVector<hsize_t>& chunk() const { return mChunk; }

    /// The chunk that begins at `start`, which lies in the dataset. An absent chunk is a failure.
    Result readChunk(const QVector<hsize_t>& start, QByteArray& bytes) const;

    /// Where that chunk is stored; nowhere when it is absent.
    Result locateChunk(const QVector<hsize_t>& start, ChunkPlace& place) const;

    const ChunkForm& form() const { return mForm; }

    /// `bytes` are as many as a chunk has.
    Result writeChunk(const QVector<hsize_t>& start, const QByteArray& bytes);

private:
    Result readType();
    Result readLayout();
    Result readFilters(hid_t properties);
    Result readDims();
    bool setChunkBytes();

    Handle mDataset;
    Handle mType;
    QVector<hsize_t> mDims;
    QVector<hsize_t> mChunk;
    ChunkForm mForm;
};

/// The number of elements; 0 when one of the dimensions is, or when there are more than `limit`.
qint64 elementCount(const QVector<hsize_t>& dims, qint64 limit);

}  // namespace Kdd::VolumeFile
