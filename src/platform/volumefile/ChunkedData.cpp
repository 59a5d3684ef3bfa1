#include "platform/volumefile/ChunkedData.h"

#include "platform/volumefile/ChunkCoding.h"
#include "platform/volumefile/VolumeFileFormat.h"
#include "platform/volumefile/hdf5/OwnTypes.h"

#include <array>
#include <limits>

namespace Kdd::VolumeFile
{
namespace
{

static_assert(Q_BYTE_ORDER == Q_LITTLE_ENDIAN, "chunks hold numbers in the byte order of this machine");

constexpr unsigned kDeflateLevel = 1;

}  // namespace

qint64 elementCount(const QVector<hsize_t>& dims, qint64 limit)
{
    qint64 count = 1;
    for (const hsize_t dim : dims) {
        // Divided before it is multiplied, so that no product of claimed dimensions wraps.
        if (dim == 0 || dim > static_cast<hsize_t>(limit / count))
            return 0;
        count *= static_cast<qint64>(dim);
    }
    return count;
}

Result ChunkedData::open(hid_t group, const QByteArray& name)
{
    Result opened = openMember(group, name, mDataset);
    if (opened.bad())
        return opened;
    if (H5Iget_type(mDataset.id()) != H5I_DATASET)
        return Result::failure(QStringLiteral("is no dataset"));
    // In this order, for each step relies on the one before: asking a virtual dataset for its dimensions, for example,
    // would look for other files.
    for (const auto step : {&ChunkedData::readType, &ChunkedData::readLayout, &ChunkedData::readDims}) {
        Result read = (this->*step)();
        if (read.bad())
            return read;
    }
    return {};
}

Result ChunkedData::readType()
{
    mType = Handle(H5Dget_type(mDataset.id()), H5Tclose);
    const H5T_class_t kind = H5Tget_class(mType.id());
    // A variable-length text is kept in another place of the file, without a checksum.
    const bool isFixedText = kind == H5T_STRING && H5Tis_variable_str(mType.id()) == 0;
    // No element of ours is longer than a real of eight bytes; a text of a dataset has one character for each
    // element.
    const std::size_t size = H5Tget_size(mType.id());
    if ((kind != H5T_INTEGER && kind != H5T_FLOAT && !isFixedText) || size < 1 || size > sizeof(double))
        return Result::failure(QStringLiteral("has elements that are neither numbers nor characters"));
    mForm.elementSize = static_cast<int>(size);
    return {};
}

Result ChunkedData::readLayout()
{
    const Handle properties(H5Dget_create_plist(mDataset.id()), H5Pclose);
    if (!properties.isOpen())
        return libraryFailure(QStringLiteral("cannot examine how it is stored"));
    if (H5Pget_layout(properties.id()) != H5D_CHUNKED)
        return Result::failure(QStringLiteral("is not stored in chunks"));
    // A dataset of more dimensions than there is room for tells its rank all the same and fills what is
    // there.
    std::array<hsize_t, kMaxRank> chunk{};
    const int rank = H5Pget_chunk(properties.id(), kMaxRank, chunk.data());
    if (rank < 1 || rank > kMaxRank)
        return Result::failure(QStringLiteral("has chunks of %1 dimensions").arg(rank));
    mChunk = QVector<hsize_t>(chunk.begin(), chunk.begin() + rank);
    if (!setChunkBytes())
        return Result::failure(QStringLiteral("has chunks of more than %1 bytes").arg(kMaxChunkBytes));
    return readFilters(properties.id());
}

bool ChunkedData::setChunkBytes()
{
    // elementCount is 0 for what is too large, so the check below catches both.
    mForm.chunkBytes =
        static_cast<int>(elementCount(mChunk, kMaxChunkBytes / mForm.elementSize)) * mForm.elementSize;
    return mForm.chunkBytes > 0;
}

Result ChunkedData::readFilters(hid_t properties)
{
    const int count = H5Pget_nfilters(properties);
    mForm.isShuffled = count == 2;
    for (int i = 0; i < count; ++i) {
        unsigned flags = 0;
        unsigned parameter = 0;
        // No filter that is taken has more than one parameter.
        std::size_t numParameters = 1;
        const H5Z_filter_t filter = H5Pget_filter2(properties, static_cast<unsigned>(i), &flags,
                                                   &numParameters, &parameter, 0, nullptr, nullptr);
        // The shuffle must run with our own element size, for decode() undoes it with that one.
        const bool isShuffle = mForm.isShuffled && i == 0 && filter == H5Z_FILTER_SHUFFLE &&
                               numParameters == 1 && parameter == static_cast<unsigned>(mForm.elementSize);
        const bool isDeflate = i == count - 1 && filter == H5Z_FILTER_DEFLATE;
        if (!isShuffle && !isDeflate)
            return Result::failure(QStringLiteral("has filter %1 at place %2").arg(filter).arg(i));
    }
    // The checksum of the compression is what guards the pixels.
    return count > 0 ? Result() : Result::failure(QStringLiteral("is not compressed"));
}

Result ChunkedData::readDims()
{
    const Handle space(H5Dget_space(mDataset.id()), H5Sclose);
    std::array<hsize_t, kMaxRank> dims{};
    const int rank = H5Sget_simple_extent_ndims(space.id());
    if (rank != mChunk.size() || H5Sget_simple_extent_dims(space.id(), dims.data(), nullptr) != rank)
        return Result::failure(
            QStringLiteral("has %1 dimensions and chunks of %2").arg(rank).arg(mChunk.size()));
    mDims = QVector<hsize_t>(dims.begin(), dims.begin() + rank);
    return {};
}

Result ChunkedData::create(hid_t group, const QByteArray& name, hid_t type, const QVector<hsize_t>& dims,
                           const QVector<hsize_t>& chunk)
{
    mDims = dims;
    mChunk = chunk;
    mType = Handle(H5Tcopy(type), H5Tclose);
    mForm.elementSize = static_cast<int>(H5Tget_size(type));
    // Bytes that are elements already have no planes to be sorted into.
    mForm.isShuffled = mForm.elementSize > 1;
    if (!setChunkBytes())
        return Result::failure(QStringLiteral("has chunks of more than %1 bytes").arg(kMaxChunkBytes));
    const Handle space(H5Screate_simple(dims.size(), dims.constData(), nullptr), H5Sclose);
    const Handle properties(H5Pcreate(ownType(OwnType::DatasetCreation)), H5Pclose);
    H5Pset_chunk(properties.id(), chunk.size(), chunk.constData());
    if (mForm.isShuffled)
        H5Pset_shuffle(properties.id());
    H5Pset_deflate(properties.id(), kDeflateLevel);
    mDataset = Handle(
        H5Dcreate2(group, name.constData(), type, space.id(), H5P_DEFAULT, properties.id(), H5P_DEFAULT),
        H5Dclose);
    return mDataset.isOpen() ? Result() : libraryFailure(QStringLiteral("cannot be made"));
}

Result ChunkedData::readChunk(const QVector<hsize_t>& start, QByteArray& bytes) const
{
    hsize_t size = 0;
    if (H5Dget_chunk_storage_size(mDataset.id(), start.constData(), &size) < 0)
        return libraryFailure(QStringLiteral("cannot be found"));
    const Handle file(H5Iget_file_id(mDataset.id()), H5Fclose);
    hsize_t fileSize = 0;
    if (size != 0 && H5Fget_filesize(file.id(), &fileSize) < 0)
        return libraryFailure(QStringLiteral("cannot be checked"));
    // A claim that is too large for the type becomes a negative one.
    Result plausible = checkStored(static_cast<qint64>(size), static_cast<qint64>(fileSize), mForm);
    if (plausible.bad())
        return plausible;
    QByteArray stored(static_cast<int>(size), Qt::Uninitialized);
    // The chunk is read as it is stored; its filters are undone here and not inside the library.
    unsigned skippedFilters = 0;
    if (H5Dread_chunk(mDataset.id(), H5P_DEFAULT, start.constData(), &skippedFilters, stored.data()) < 0)
        return libraryFailure(QStringLiteral("cannot be read"));
    return decodeChunk(stored, skippedFilters, mForm, bytes);
}

Result ChunkedData::locateChunk(const QVector<hsize_t>& start, ChunkPlace& place) const
{
    unsigned skippedFilters = 0;
    haddr_t offset = HADDR_UNDEF;
    hsize_t size = 0;
    if (H5Dget_chunk_info_by_coord(mDataset.id(), start.constData(), &skippedFilters, &offset, &size) < 0)
        return libraryFailure(QStringLiteral("cannot be found"));
    const auto most = static_cast<quint64>(std::numeric_limits<qint64>::max());
    const bool isThere = offset != HADDR_UNDEF && offset <= most && size <= most;
    place = isThere ? ChunkPlace{static_cast<qint64>(offset), static_cast<qint64>(size), skippedFilters}
                    : ChunkPlace();
    return {};
}

Result ChunkedData::writeChunk(const QVector<hsize_t>& start, const QByteArray& bytes)
{
    if (bytes.size() != mForm.chunkBytes)
        return Result::failure(
            QStringLiteral("has %1 bytes instead of %2").arg(bytes.size()).arg(mForm.chunkBytes));
    const QByteArray stored = deflated(mForm.isShuffled ? shuffled(bytes, mForm.elementSize) : bytes);
    if (stored.isEmpty())
        return Result::failure(QStringLiteral("cannot be compressed"));
    // As filtered here; the mask 0 says that no filter was left out.
    if (H5Dwrite_chunk(mDataset.id(), H5P_DEFAULT, 0, start.constData(),
                       static_cast<std::size_t>(stored.size()), stored.constData()) < 0)
        return libraryFailure(QStringLiteral("cannot be written"));
    return {};
}

}  // namespace Kdd::VolumeFile
