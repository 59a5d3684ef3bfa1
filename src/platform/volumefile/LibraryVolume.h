#pragma once

#include "platform/volumefile/ChunkedData.h"
#include "platform/volumefile/VolumeReader.h"

#include <vector>

namespace Kdd::VolumeFile
{

constexpr const char* kNoVolumeFileText = "is no volume file";

/// A volume file that the library reads in this process.
class LibraryVolume final : public VolumeReader
{
public:
    LibraryVolume(std::unique_ptr<ByteStore> store, QByteArray name);
    ~LibraryVolume() override;

    /// To be called once, first. Reads the header.
    Result open();

    Result readSlice(int lattice, int slice, QByteArray& bytes) override;
    Result readCounts(const QByteArray& section, QVector<quint64>& counts) override;

    /// Where they are stored, for whoever reads them without the library.
    Result locateSlice(int lattice, int slice, ChunkPlace& place) const;
    Result locateCounts(const QByteArray& section, ChunkPlace& place, int& count) const;

private:
    Result readHeader();
    Result readMember(hid_t root, const QByteArray& member);
    Result readLattices(hid_t group);
    Result openCounts(const QByteArray& section, ChunkedData& data) const;
    const ChunkedData& dataOf(int lattice) const;
    QVector<hsize_t> startOf(int lattice, int slice) const;

    QByteArray mName;
    std::unique_ptr<ByteStore> mStore;
    // Below what they read from, so that they are closed first.
    Handle mFile;
    Handle mSections;
    std::vector<ChunkedData> mLattices;
};

}  // namespace Kdd::VolumeFile
