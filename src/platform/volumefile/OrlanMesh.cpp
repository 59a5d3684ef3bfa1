#include "platform/volumefile/OrlanMesh.h"

#include "platform/decoder/DecoderPlace.h"
#include "platform/decoder/DecoderPool.h"
#include "platform/late/LateLibrary.h"
#include "platform/volumefile/LibraryVolume.h"
#include "platform/volumefile/ReadStore.h"
#include "platform/volumefile/VolumeReader.h"

#include <cstring>
#include <utility>

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

Result checkHead(ByteStore& store)
{
    char head[kHeadSize] = {};
    return store.size() >= kHeadSize && store.read(0, head, kHeadSize) && isHead(head)
               ? Result()
               : Result::failure(QLatin1String(kNoVolumeFileText));
}

/// The head first: a form of the file that has no checksums never reaches the library.
std::unique_ptr<VolumeReader> openReader(std::unique_ptr<ByteStore> store, const QByteArray& name,
                                         Result& result)
{
    result = checkHead(*store);
    if (result.bad())
        return nullptr;
    if (decoderPlace() == DecoderPlace::Apart)
        return openApart(DecoderPool::ofProcess(), std::move(store), name, result);
    result = loadLate(LateLibrary::VolumeFiles);
    return result.good() ? openInside(std::move(store), name, result) : nullptr;
}

}  // namespace

struct KDD_LOCAL OrlanMesh::Private
{
    QByteArray name;
    std::unique_ptr<VolumeReader> reader;

    const VolumeHeader& header() const { return reader->header(); }
    Result readSlice(const QByteArray& latticeName, int slice, TypedData2D& pixels) const;
};

/// By its name alone: what the caller's description claims is not relied upon.
Result OrlanMesh::Private::readSlice(const QByteArray& latticeName, int slice, TypedData2D& pixels) const
{
    const QVector<Lattice>& lattices = header().lattices;
    // A description may have been made for another file, or been changed since.
    int at = 0;
    while (at < lattices.size() && lattices.at(at).name != latticeName)
        ++at;
    if (at == lattices.size() || lattices.at(at).dims.size() != 3)
        return Result::failure(QStringLiteral("is of no lattice of slices"));
    const Lattice& lattice = lattices.at(at);
    if (slice < 0 || slice >= lattice.dims.at(2))
        return Result::failure(QStringLiteral("is not between 0 and %1").arg(lattice.dims.at(2) - 1));
    QByteArray stored;
    Result read = reader->readSlice(at, slice, stored);
    if (read.good())
        pixels = {lattice.dims.at(0), lattice.dims.at(1), lattice.components, lattice.type, stored};
    return read;
}

OrlanMesh::OrlanMesh(std::unique_ptr<Private> opened)
    : mPrivate(std::move(opened))
{
}

OrlanMesh::~OrlanMesh() = default;

std::unique_ptr<OrlanMesh> OrlanMesh::read(const QByteArray& path, Result& result)
{
    auto file = std::make_unique<FileToRead>();
    result = file->open(path);
    auto d = std::make_unique<Private>();
    d->name = path;
    if (result.good())
        d->reader = openReader(std::move(file), path, result);
    result = result.within(refusalOf(path));
    return std::unique_ptr<OrlanMesh>(result.good() ? new OrlanMesh(std::move(d)) : nullptr);
}

std::unique_ptr<OrlanMesh> OrlanMesh::read(const QByteArray& bytes, const QByteArray& name, Result& result)
{
    auto d = std::make_unique<Private>();
    d->name = name;
    d->reader = openReader(std::make_unique<BytesToRead>(bytes), name, result);
    result = result.within(refusalOf(name));
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
    return mPrivate->header().parameters;
}

const QVector<Lattice>& OrlanMesh::lattices() const
{
    return mPrivate->header().lattices;
}

const Lattice* OrlanMesh::findLattice(const QByteArray& prefix, int numDims) const
{
    for (const Lattice& lattice : mPrivate->header().lattices) {
        if (lattice.name.startsWith(prefix) && lattice.dims.size() == numDims)
            return &lattice;
    }
    return nullptr;
}

Result OrlanMesh::readSlice(const Lattice& lattice, int slice, TypedData2D& pixels) const
{
    const QString context = QStringLiteral("%1: slice %2").arg(refusalOf(mPrivate->name)).arg(slice);
    return mPrivate->readSlice(lattice.name, slice, pixels).within(context);
}

bool OrlanMesh::hasDataSection(const QByteArray& name) const
{
    return mPrivate->header().dataSections.contains(name);
}

Result OrlanMesh::readDataSection(const QByteArray& name, QVector<quint64>& counts) const
{
    const QString section =
        QStringLiteral("%1: data section \"%2\"").arg(refusalOf(mPrivate->name), QString::fromUtf8(name));
    const Result read = hasDataSection(name) ? mPrivate->reader->readCounts(name, counts)
                                             : Result::failure(QStringLiteral("is absent"));
    return read.within(section);
}

}  // namespace Kdd
