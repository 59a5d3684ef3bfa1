#include "platform/volumefile/OrlanMeshWriter.h"

#include "platform/late/LateLibrary.h"
#include "platform/volumefile/LatticeFile.h"
#include "platform/volumefile/ParameterFile.h"
#include "platform/volumefile/PartFile.h"
#include "platform/volumefile/hdf5/OwnTypes.h"

#include <algorithm>
#include <vector>

namespace Kdd
{

using namespace VolumeFile;

namespace
{

Result createGroup(hid_t parent, const char* name, Handle& group)
{
    group = Handle(H5Gcreate2(parent, name, H5P_DEFAULT, H5P_DEFAULT, H5P_DEFAULT), H5Gclose);
    return group.isOpen() ? Result()
                          : libraryFailure(QStringLiteral("group %1").arg(QString::fromLatin1(name)));
}

}  // namespace

struct KDD_LOCAL OrlanMeshWriter::Private
{
    QByteArray path;
    Lattice lattice;
    // Above what is written into it, so that it is closed last.
    PartFile part;
    Handle file;
    Handle dataSections;
    ChunkedData data;
    std::vector<bool> isWritten;  // one for each slice
    int numDataSections = 0;

    Result createFile();
    Result start();
    Result checkSlice(int slice, const TypedData2D& pixels) const;
    bool closeFile();

    /// What a call answers: its own failure, or what the disk refused meanwhile.
    Result answer(const Result& result) const
    {
        return (result.good() ? part.state() : result)
            .within(QStringLiteral("Volume file %1").arg(QString::fromUtf8(path)));
    }
};

Result OrlanMeshWriter::Private::createFile()
{
    Result result = part.create(path);
    if (result.bad())
        return result;
    const Handle access = accessTo(part);
    // Every piece of metadata has a checksum in this form.
    H5Pset_libver_bounds(access.id(), H5F_LIBVER_V110, H5F_LIBVER_V110);
    file = Handle(H5Fcreate(path.constData(), H5F_ACC_TRUNC, H5P_DEFAULT, access.id()), H5Fclose);
    if (!file.isOpen())
        return libraryFailure(QStringLiteral("cannot be made"));
    result = writeAttribute(file.id(), kFormatAttribute, Parameter::ofText(kFormatName));
    if (result.good())
        result = writeAttribute(file.id(), kVersionAttribute, Parameter::ofIntegers({kFormatVersion}));
    return result;
}

Result OrlanMeshWriter::Private::start()
{
    Handle group;
    Result result = createFile();
    if (result.good())
        result = createGroup(file.id(), kLatticesGroup, group);
    if (result.good())
        result = createLattice(group.id(), lattice, data);
    if (result.good())
        isWritten.assign(static_cast<std::size_t>(lattice.dims.at(2)), false);
    return result;
}

Result OrlanMeshWriter::Private::checkSlice(int slice, const TypedData2D& pixels) const
{
    // finish() has closed it.
    if (!data.isOpen())
        return Result::failure(QStringLiteral("comes after the end"));
    if (slice < 0 || slice >= lattice.dims.at(2))
        return Result::failure(QStringLiteral("is not between 0 and %1").arg(lattice.dims.at(2) - 1));
    if (pixels.width != lattice.dims.at(0) || pixels.height != lattice.dims.at(1) ||
        pixels.components != lattice.components || pixels.type != lattice.type)
        return Result::failure(QStringLiteral("is unlike the lattice"));
    return {};
}

bool OrlanMeshWriter::Private::closeFile()
{
    // The file itself last: what is still open in it would keep the library from finishing it.
    data = ChunkedData();
    const bool isClosed = dataSections.close();
    return file.close() && isClosed;
}

OrlanMeshWriter::OrlanMeshWriter(std::unique_ptr<Private> opened)
    : mPrivate(std::move(opened))
{
}

OrlanMeshWriter::~OrlanMeshWriter()
{
    const QuietErrors quiet;
    mPrivate.reset();
}

std::unique_ptr<OrlanMeshWriter> OrlanMeshWriter::create(const QByteArray& path, const Lattice& lattice,
                                                         Result& result)
{
    result = loadLate(LateLibrary::VolumeFiles);
    if (result.bad())
        return nullptr;
    const QuietErrors quiet;
    auto d = std::make_unique<Private>();
    d->path = path;
    d->lattice = lattice;
    // There is one lattice in a file that is written, and readers look for it under this name.
    d->lattice.name = "Level0";
    result = d->answer(d->start());
    return std::unique_ptr<OrlanMeshWriter>(result.good() ? new OrlanMeshWriter(std::move(d)) : nullptr);
}

Result OrlanMeshWriter::writeSlice(int slice, const TypedData2D& pixels)
{
    const QuietErrors quiet;
    Result result = mPrivate->checkSlice(slice, pixels);
    QVector<hsize_t> start(mPrivate->data.dims().size(), 0);
    if (result.good()) {
        start.first() = static_cast<hsize_t>(slice);
        result = mPrivate->data.writeChunk(start, pixels.pixels);
    }
    result = mPrivate->answer(result.within(QStringLiteral("slice %1").arg(slice)));
    // Only what the disk has taken counts; finish() asks for all slices.
    if (result.good())
        mPrivate->isWritten[static_cast<std::size_t>(slice)] = true;
    return result;
}

Result OrlanMeshWriter::writeParameters(const ParamBundle& parameters)
{
    const QuietErrors quiet;
    Handle group;
    // The bounds that readers hold, so that nothing is written that would not be read.
    ParameterBudget budget;
    Result result = createGroup(mPrivate->file.id(), kParametersGroup, group);
    if (result.good())
        result = writeBundle(group.id(), budget, parameters);
    return mPrivate->answer(result);
}

Result OrlanMeshWriter::writeDataSection(const QByteArray& name, const QVector<quint64>& counts)
{
    const QuietErrors quiet;
    Result result;
    if (!isName(name) || counts.isEmpty() || counts.size() > kMaxCounts)
        result = Result::failure(QStringLiteral("has a wrong name or not 1 to %1 counts").arg(kMaxCounts));
    if (result.good() && mPrivate->numDataSections >= kMaxDataSections)
        result = Result::failure(QStringLiteral("is one of more than %1").arg(kMaxDataSections));
    // The group is made with the first section, for an absent group counts as an empty one.
    if (result.good() && !mPrivate->dataSections.isOpen())
        result = createGroup(mPrivate->file.id(), kDataSectionsGroup, mPrivate->dataSections);
    ChunkedData data;
    const QVector<hsize_t> dims{static_cast<hsize_t>(counts.size())};
    if (result.good())
        result = data.create(mPrivate->dataSections.id(), name, ownType(OwnType::UInt64), dims, dims);
    const int size = counts.size() * static_cast<int>(sizeof(quint64));
    // Not a copy: the counts outlive the call.
    if (result.good())
        result = data.writeChunk(
            {0}, QByteArray::fromRawData(reinterpret_cast<const char*>(counts.constData()), size));
    mPrivate->numDataSections += result.good() ? 1 : 0;
    return mPrivate->answer(
        result.within(QStringLiteral("data section \"%1\"").arg(QString::fromUtf8(name))));
}

Result OrlanMeshWriter::finish()
{
    const QuietErrors quiet;
    // An absent slice is damage to every reader, so such a file never gets its name.
    const auto missing = std::find(mPrivate->isWritten.begin(), mPrivate->isWritten.end(), false);
    if (missing != mPrivate->isWritten.end())
        return mPrivate->answer(Result::failure(
            QStringLiteral("slice %1 is missing").arg(missing - mPrivate->isWritten.begin())));
    if (!mPrivate->file.isOpen())
        return mPrivate->answer(Result::failure(QStringLiteral("is finished already")));
    // Closing writes what the library still held, so its failure is one of writing.
    if (!mPrivate->closeFile())
        return mPrivate->answer(libraryFailure(QStringLiteral("cannot be written")));
    return mPrivate->answer(mPrivate->part.publish());
}

}  // namespace Kdd
