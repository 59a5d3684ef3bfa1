#include "platform/volumefile/OrlanMesh.h"

#include "platform/late/LateLibrary.h"
#include "platform/volumefile/LatticeFile.h"
#include "platform/volumefile/ParameterFile.h"
#include "platform/volumefile/ReadStore.h"
#include "platform/volumefile/hdf5/OwnTypes.h"

#include <cstring>
#include <utility>
#include <vector>

namespace Kdd
{

using namespace VolumeFile;

namespace
{

constexpr char kSignature[] = {'\x89', 'H', 'D', 'F', '\r', '\n', '\x1a', '\n'};
// Enough to refuse most other files without the library.
constexpr int kHeadSize = sizeof kSignature + 1;  // and the version of the superblock

/// From version 2 on there are checksums.
bool isHead(const char* head)
{
    return std::memcmp(head, kSignature, sizeof kSignature) == 0 && (head[8] == 2 || head[8] == 3);
}

QString refusalOf(const QByteArray& name)
{
    return QStringLiteral("Volume file %1").arg(QString::fromUtf8(name));
}

Result noVolumeFile()
{
    return Result::failure(QStringLiteral("is no volume file"));
}

Result checkHead(ByteStore& store)
{
    char head[kHeadSize] = {};
    return store.size() >= kHeadSize && store.read(0, head, kHeadSize) && isHead(head) ? Result()
                                                                                       : noVolumeFile();
}

Result checkFormat(hid_t root)
{
    // The head is that of any HDF5 file. What makes it a volume file stands in the attributes of its root.
    ParameterBudget budget;
    Parameter format;
    Parameter version;
    if (readAttribute(root, kFormatAttribute, budget, format).bad() || format.text != kFormatName)
        return noVolumeFile();
    // A later format may arrange all else differently, so nothing of it is read.
    Result read = readAttribute(root, kVersionAttribute, budget, version);
    if (read.bad() || version.integers != QVector<qint64>{kFormatVersion})
        return Result::failure(QStringLiteral("is of a format version other than %1").arg(kFormatVersion));
    return {};
}

}  // namespace

struct KDD_LOCAL OrlanMesh::Private
{
    QByteArray name;
    std::unique_ptr<ByteStore> store;
    // Below what it reads from, so that it is closed first.
    Handle file;
    Handle dataSections;
    QVector<QByteArray> dataSectionNames;
    QVector<Lattice> lattices;
    std::vector<ChunkedData> latticeData;
    ParamBundle parameters;

    Result open();
    Result readHeader();
    Result readMember(hid_t root, const QByteArray& member);
    Result readLattices(hid_t group);

    Result readSlice(const QByteArray& latticeName, int slice, TypedData2D& pixels) const;
    Result readCounts(const QByteArray& section, QVector<quint64>& counts) const;
};

/// The head first: a form of the file that has no checksums never reaches the library.
Result OrlanMesh::Private::open()
{
    Result checked = checkHead(*store);
    if (checked.bad())
        return checked;
    const Handle access = accessTo(*store);
    file = Handle(H5Fopen(name.constData(), H5F_ACC_RDONLY, access.id()), H5Fclose);
    return file.isOpen() ? readHeader() : libraryFailure(QStringLiteral("cannot be opened"));
}

Result OrlanMesh::Private::readHeader()
{
    Handle root;
    Result result = openGroup(file.id(), "/", root);
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
Result OrlanMesh::Private::readMember(hid_t root, const QByteArray& member)
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
        return readBundle(group.id(), budget, parameters);
    }
    dataSections = std::move(group);
    return listMembers(dataSections.id(), kMaxDataSections, dataSectionNames);
}

Result OrlanMesh::Private::readLattices(hid_t group)
{
    QVector<QByteArray> names;
    Result result = listMembers(group, kMaxLattices, names);
    for (int i = 0; i < names.size() && result.good(); ++i) {
        Lattice lattice;
        ChunkedData data;
        result = openLattice(group, names.at(i), data, lattice);
        result = result.within(QStringLiteral("lattice \"%1\"").arg(QString::fromUtf8(names.at(i))));
        lattices.append(lattice);
        latticeData.push_back(std::move(data));
    }
    return result;
}

/// By its name alone: what the caller's description claims is not relied upon.
Result OrlanMesh::Private::readSlice(const QByteArray& latticeName, int slice, TypedData2D& pixels) const
{
    // A description may have been made for another file, or been changed since.
    int at = 0;
    while (at < lattices.size() && lattices.at(at).name != latticeName)
        ++at;
    if (at == lattices.size() || lattices.at(at).dims.size() != 3)
        return Result::failure(QStringLiteral("is of no lattice of slices"));
    const Lattice& lattice = lattices.at(at);
    if (slice < 0 || slice >= lattice.dims.at(2))
        return Result::failure(QStringLiteral("is not between 0 and %1").arg(lattice.dims.at(2) - 1));
    const ChunkedData& data = latticeData[static_cast<std::size_t>(at)];
    // A chunk is a slice, so it begins at the slice's number and at 0 in all else.
    QVector<hsize_t> start(data.dims().size(), 0);
    start.first() = static_cast<hsize_t>(slice);
    QByteArray stored;
    Result read = data.readChunk(start, stored);
    if (read.good())
        pixels = {lattice.dims.at(0), lattice.dims.at(1), lattice.components, lattice.type, stored};
    return read;
}

Result OrlanMesh::Private::readCounts(const QByteArray& section, QVector<quint64>& counts) const
{
    if (!dataSectionNames.contains(section))
        return Result::failure(QStringLiteral("is absent"));
    ChunkedData data;
    Result opened = data.open(dataSections.id(), section);
    if (opened.bad())
        return opened;
    if (H5Tequal(data.type(), ownType(OwnType::UInt64)) <= 0 || data.dims().size() != 1 ||
        data.chunk() != data.dims())
        return Result::failure(QStringLiteral("is not one chunk of 64-bit counts"));
    // The bound holds before memory is taken; readChunk has its own for the bytes in the file.
    if (elementCount(data.dims(), kMaxCounts) == 0)
        return Result::failure(
            QStringLiteral("has %1 counts, %2 are the most").arg(data.dims().first()).arg(kMaxCounts));
    QByteArray stored;
    Result read = data.readChunk({0}, stored);
    if (read.bad())
        return read;
    QVector<quint64> values(static_cast<int>(data.dims().first()));
    std::memcpy(values.data(), stored.constData(), static_cast<std::size_t>(stored.size()));
    counts.swap(values);
    return {};
}

OrlanMesh::OrlanMesh(std::unique_ptr<Private> opened)
    : mPrivate(std::move(opened))
{
}

OrlanMesh::~OrlanMesh()
{
    const QuietErrors quiet;
    mPrivate.reset();
}

std::unique_ptr<OrlanMesh> OrlanMesh::read(const QByteArray& path, Result& result)
{
    result = loadLate(LateLibrary::VolumeFiles).within(refusalOf(path));
    if (result.bad())
        return nullptr;
    const QuietErrors quiet;
    auto file = std::make_unique<FileToRead>();
    auto d = std::make_unique<Private>();
    d->name = path;
    result = file->open(path);
    d->store = std::move(file);
    if (result.good())
        result = d->open();
    result = result.within(refusalOf(path));
    return std::unique_ptr<OrlanMesh>(result.good() ? new OrlanMesh(std::move(d)) : nullptr);
}

std::unique_ptr<OrlanMesh> OrlanMesh::read(const QByteArray& bytes, const QByteArray& name, Result& result)
{
    result = loadLate(LateLibrary::VolumeFiles).within(refusalOf(name));
    if (result.bad())
        return nullptr;
    const QuietErrors quiet;
    auto d = std::make_unique<Private>();
    d->name = name;
    d->store = std::make_unique<BytesToRead>(bytes);
    result = d->open().within(refusalOf(name));
    return std::unique_ptr<OrlanMesh>(result.good() ? new OrlanMesh(std::move(d)) : nullptr);
}

bool OrlanMesh::isVolumeFile(const QByteArray& path)
{
    FileToRead file;
    return file.open(path).good() && checkHead(file).good();
}

const QByteArray& OrlanMesh::name() const
{
    return mPrivate->name;
}

const ParamBundle& OrlanMesh::parameters() const
{
    return mPrivate->parameters;
}

const QVector<Lattice>& OrlanMesh::lattices() const
{
    return mPrivate->lattices;
}

const Lattice* OrlanMesh::findLattice(const QByteArray& prefix, int numDims) const
{
    for (const Lattice& lattice : qAsConst(mPrivate->lattices)) {
        if (lattice.name.startsWith(prefix) && lattice.dims.size() == numDims)
            return &lattice;
    }
    return nullptr;
}

Result OrlanMesh::readSlice(const Lattice& lattice, int slice, TypedData2D& pixels) const
{
    const QuietErrors quiet;
    const QString context = QStringLiteral("%1: slice %2").arg(refusalOf(mPrivate->name)).arg(slice);
    return mPrivate->readSlice(lattice.name, slice, pixels).within(context);
}

bool OrlanMesh::hasDataSection(const QByteArray& name) const
{
    return mPrivate->dataSectionNames.contains(name);
}

Result OrlanMesh::readDataSection(const QByteArray& name, QVector<quint64>& counts) const
{
    const QuietErrors quiet;
    const QString section =
        QStringLiteral("%1: data section \"%2\"").arg(refusalOf(mPrivate->name), QString::fromUtf8(name));
    return mPrivate->readCounts(name, counts).within(section);
}

}  // namespace Kdd
