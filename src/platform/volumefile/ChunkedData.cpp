#include "platform/volumefile/ChunkedData.h"

#include "platform/volumefile/ChunkCoding.h"
#include "platform/volumefile/VolumeFileFormat.h"
#include "platform/volumefile/hdf5/OwnTypes.h"

#include <array>

namespace Kdd::VolumeFile
{
namespace
{

static_assert(Q_BYTE_ORDER == Q_LITTLE_ENDIAN, "chunks hold numbers in the byte order of this machine");

constexpr unsigned kDeflateLevel = 1;
// What compression may add to a chunk that cannot be compressed.
constexpr qint64 kMaxOverhead = 1024;

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
    mElementSize = static_cast<int>(size);
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
    mChunkBytes = static_cast<int>(elementCount(mChunk, kMaxChunkBytes / mElementSize)) * mElementSize;
    return mChunkBytes > 0;
}

Result ChunkedData::readFilters(hid_t properties)
{
    const int count = H5Pget_nfilters(properties);
    mIsShuffled = count == 2;
    for (int i = 0; i < count; ++i) {
        unsigned flags = 0;
        unsigned parameter = 0;
        // No filter that is taken has more than one parameter.
        std::size_t numParameters = 1;
        const H5Z_filter_t filter = H5Pget_filter2(properties, static_cast<unsigned>(i), &flags,
                                                   &numParameters, &parameter, 0, nullptr, nullptr);
        // The shuffle must run with our own element size, for decode() undoes it with that one.
        const bool isShuffle = mIsShuffled && i == 0 && filter == H5Z_FILTER_SHUFFLE && numParameters == 1 &&
                               parameter == static_cast<unsigned>(mElementSize);
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
    mElementSize = static_cast<int>(H5Tget_size(type));
    // Bytes that are elements already have no planes to be sorted into.
    mIsShuffled = mElementSize > 1;
    if (!setChunkBytes())
        return Result::failure(QStringLiteral("has chunks of more than %1 bytes").arg(kMaxChunkBytes));
    const Handle space(H5Screate_simple(dims.size(), dims.constData(), nullptr), H5Sclose);
    const Handle properties(H5Pcreate(ownType(OwnType::DatasetCreation)), H5Pclose);
    H5Pset_chunk(properties.id(), chunk.size(), chunk.constData());
    if (mIsShuffled)
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
    Result plausible = checkStored(size);
    if (plausible.bad())
        return plausible;
    QByteArray stored(static_cast<int>(size), Qt::Uninitialized);
    // The chunk is read as it is stored; its filters are undone here and not inside the library.
    unsigned skippedFilters = 0;
    if (H5Dread_chunk(mDataset.id(), H5P_DEFAULT, start.constData(), &skippedFilters, stored.data()) < 0)
        return libraryFailure(QStringLiteral("cannot be read"));
    return decode(stored, skippedFilters, bytes);
}

Result ChunkedData::checkStored(hsize_t stored) const
{
    if (stored == 0)
        return Result::failure(QStringLiteral("is not in the file"));
    // A length that cannot be is refused before memory is taken for it.
    const Handle file(H5Iget_file_id(mDataset.id()), H5Fclose);
    hsize_t fileSize = 0;
    if (H5Fget_filesize(file.id(), &fileSize) < 0)
        return libraryFailure(QStringLiteral("cannot be checked"));
    const auto most = static_cast<hsize_t>(mChunkBytes + mChunkBytes / 16 + kMaxOverhead);
    if (stored > fileSize || stored > most || !canInflate(static_cast<qint64>(stored), mChunkBytes))
        return Result::failure(QStringLiteral("claims %1 bytes for %2").arg(stored).arg(mChunkBytes));
    return {};
}

/// Undoes the filters in the reverse order of writing: first the compression, then the shuffling.
Result ChunkedData::decode(const QByteArray& stored, unsigned skippedFilters, QByteArray& bytes) const
{
    // Other writers store a chunk as it is when a filter gains nothing, and mark the filter by its place.
    const unsigned deflate = mIsShuffled ? 2 : 1;
    const bool isShuffled = mIsShuffled && (skippedFilters & 1U) == 0;
    const QByteArray content = (skippedFilters & deflate) != 0 ? stored : inflated(stored, mChunkBytes);
    // What was stored uncompressed has not been held against its exact size yet.
    if (content.size() != mChunkBytes)
        return Result::failure(QStringLiteral("is damaged"));
    bytes = isShuffled ? unshuffled(content, mElementSize) : content;
    return {};
}

Result ChunkedData::writeChunk(const QVector<hsize_t>& start, const QByteArray& bytes)
{
    if (bytes.size() != mChunkBytes)
        return Result::failure(
            QStringLiteral("has %1 bytes instead of %2").arg(bytes.size()).arg(mChunkBytes));
    const QByteArray stored = deflated(mIsShuffled ? shuffled(bytes, mElementSize) : bytes);
    if (stored.isEmpty())
        return Result::failure(QStringLiteral("cannot be compressed"));
    // As filtered here; the mask 0 says that no filter was left out.
    if (H5Dwrite_chunk(mDataset.id(), H5P_DEFAULT, 0, start.constData(),
                       static_cast<std::size_t>(stored.size()), stored.constData()) < 0)
        return libraryFailure(QStringLiteral("cannot be written"));
    return {};
}

}  // namespace Kdd::VolumeFile
