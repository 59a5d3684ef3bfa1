#include "platform/volumefile/LibraryVolume.h"

#include "platform/volumefile/LatticeFile.h"
#include "platform/volumefile/ParameterFile.h"
#include "platform/volumefile/hdf5/OwnTypes.h"

#include <cstring>
#include <utility>

namespace Kdd::VolumeFile
{
namespace
{

Result checkFormat(hid_t root)
{
    // The head is that of any HDF5 file. What makes it a volume file stands in the attributes of its root.
    ParameterBudget budget;
    Parameter format;
    Parameter version;
    if (readAttribute(root, kFormatAttribute, budget, format).bad() || format.text != kFormatName)
        return Result::failure(QLatin1String(kNoVolumeFileText));
    // A later format may arrange all else differently, so nothing of it is read.
    Result read = readAttribute(root, kVersionAttribute, budget, version);
    if (read.bad() || version.integers != QVector<qint64>{kFormatVersion})
        return Result::failure(QStringLiteral("is of a format version other than %1").arg(kFormatVersion));
    return {};
}

}  // namespace

LibraryVolume::LibraryVolume(std::unique_ptr<ByteStore> store, QByteArray name)
    : mName(std::move(name))
    , mStore(std::move(store))
{
}

LibraryVolume::~LibraryVolume()
{
    const QuietErrors quiet;
    mSections = Handle();
    mLattices.clear();
    mFile = Handle();
}

Result LibraryVolume::open()
{
    const QuietErrors quiet;
    const Handle access = accessTo(*mStore);
    mFile = Handle(H5Fopen(mName.constData(), H5F_ACC_RDONLY, access.id()), H5Fclose);
    return mFile.isOpen() ? readHeader() : libraryFailure(QStringLiteral("cannot be opened"));
}

Result LibraryVolume::readHeader()
{
    Handle root;
    Result result = openGroup(mFile.id(), "/", root);
    if (result.good())
        result = checkFormat(root.id());
    QVector<QByteArray> members;
    if (result.good())
        result = listMembers(root.id(), kMaxRootMembers, members);
    for (int i = 0; i < members.size() && result.good(); ++i)
        result = readMember(root.id(), members.at(i));
    return result;
}

/// Members that are not known are passed over, so that later writers can add some.
Result LibraryVolume::readMember(hid_t root, const QByteArray& member)
{
    if (member != kLatticesGroup && member != kParametersGroup && member != kDataSectionsGroup)
        return {};
    Handle group;
    Result opened = openGroup(root, member, group);
    if (opened.bad())
        return opened;
    if (member == kLatticesGroup)
        return readLattices(group.id());
    if (member == kParametersGroup) {
        // One budget for the whole file, shared by all bundles below.
        ParameterBudget budget;
        return readBundle(group.id(), budget, mHeader.parameters);
    }
    mSections = std::move(group);
    return listMembers(mSections.id(), kMaxDataSections, mHeader.dataSections);
}

Result LibraryVolume::readLattices(hid_t group)
{
    QVector<QByteArray> names;
    Result result = listMembers(group, kMaxLattices, names);
    for (int i = 0; i < names.size() && result.good(); ++i) {
        Lattice lattice;
        ChunkedData data;
        result = openLattice(group, names.at(i), data, lattice);
        result = result.within(QStringLiteral("lattice \"%1\"").arg(QString::fromUtf8(names.at(i))));
        mHeader.lattices.append(lattice);
        mLattices.push_back(std::move(data));
    }
    return result;
}

/// A chunk is a slice, so it begins at the slice's number and at 0 in all else.
QVector<hsize_t> LibraryVolume::startOf(int lattice, int slice) const
{
    QVector<hsize_t> start(dataOf(lattice).dims().size(), 0);
    start.first() = static_cast<hsize_t>(slice);
    return start;
}

const ChunkedData& LibraryVolume::dataOf(int lattice) const
{
    return mLattices[static_cast<std::size_t>(lattice)];
}

Result LibraryVolume::readSlice(int lattice, int slice, QByteArray& bytes)
{
    const QuietErrors quiet;
    return dataOf(lattice).readChunk(startOf(lattice, slice), bytes);
}

Result LibraryVolume::locateSlice(int lattice, int slice, ChunkPlace& place) const
{
    const QuietErrors quiet;
    Result located = dataOf(lattice).locateChunk(startOf(lattice, slice), place);
    place.isShuffled = dataOf(lattice).form().isShuffled ? 1 : 0;
    return located;
}

Result LibraryVolume::openCounts(const QByteArray& section, ChunkedData& data) const
{
    Result opened = data.open(mSections.id(), section);
    if (opened.bad())
        return opened;
    if (H5Tequal(data.type(), ownType(OwnType::UInt64)) <= 0 || data.dims().size() != 1 ||
        data.chunk() != data.dims())
        return Result::failure(QStringLiteral("is not one chunk of 64-bit counts"));
    // The bound holds before memory is taken; readChunk has its own for the bytes in the file.
    if (elementCount(data.dims(), kMaxCounts) == 0)
        return Result::failure(
            QStringLiteral("has %1 counts, %2 are the most").arg(data.dims().first()).arg(kMaxCounts));
    return {};
}

Result LibraryVolume::readCounts(const QByteArray& section, QVector<quint64>& counts)
{
    const QuietErrors quiet;
    ChunkedData data;
    Result read = openCounts(section, data);
    QByteArray stored;
    if (read.good())
        read = data.readChunk({0}, stored);
    if (read.bad())
        return read;
    QVector<quint64> values(static_cast<int>(data.dims().first()));
    std::memcpy(values.data(), stored.constData(), static_cast<std::size_t>(stored.size()));
    counts.swap(values);
    return {};
}

Result LibraryVolume::locateCounts(const QByteArray& section, ChunkPlace& place, int& count) const
{
    const QuietErrors quiet;
    ChunkedData data;
    Result located = openCounts(section, data);
    if (located.good())
        located = data.locateChunk({0}, place);
    if (located.bad())
        return located;
    place.isShuffled = data.form().isShuffled ? 1 : 0;
    count = static_cast<int>(data.dims().first());
    return {};
}

std::unique_ptr<VolumeReader> openInside(std::unique_ptr<ByteStore> store, const QByteArray& name,
                                         Result& result)
{
    auto volume = std::make_unique<LibraryVolume>(std::move(store), name);
    result = volume->open();
    return result.good() ? std::move(volume) : nullptr;
}

}  // namespace Kdd::VolumeFile
