#pragma once

#include "platform/volumefile/ChunkCoding.h"
#include "platform/volumefile/VolumeFileFormat.h"
#include "platform/volumefile/VolumeReader.h"

namespace Kdd::VolumeFile
{

/// The header of a volume file, and where all that it lists is stored.
struct LocatedHeader
{
    VolumeHeader header;
    QVector<QVector<ChunkPlace>> slices;  ///< for each lattice; none of one that has not three dimensions
    QVector<ChunkPlace> counts;           ///< for each data section
    QVector<int> numCounts;               ///< likewise; 0 of one that is not of counts
    QVector<QByteArray> countFaults;      ///< and why
};

/// The most slices whose places are told, those of all lattices together.
constexpr int kMaxPlaces = 1'000'000;

/// The most bytes of it.
constexpr qint64 kMaxHeaderBytes = kMaxParameterBytes + qint64(64) * 1024 * 1024;

/// Between a process and its decoder.
QByteArray bytesOfHeader(const LocatedHeader& header);

/// False when these bytes are no header, or one that no volume file can have.
bool readHeader(const QByteArray& bytes, LocatedHeader& header);

}  // namespace Kdd::VolumeFile
