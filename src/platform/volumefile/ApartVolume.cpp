#include "platform/volumefile/ApartVolume.h"

#include "platform/decoder/DecoderPool.h"
#include "platform/late/LateLibrary.h"
#include "platform/volumefile/LibraryVolume.h"
#include "platform/volumefile/ReadStore.h"
#include "platform/volumefile/VolumeHeaderBytes.h"

#include <QHash>

#include <algorithm>
#include <cstring>
#include <utility>

namespace Kdd::VolumeFile
{
namespace
{

// More than the header of any file takes, of which parts are read again and again.
constexpr qint64 kMostRead = qint64(1) << 30;

struct VolumeQuestion
{
    qint64 size;  ///< of the file [bytes]
};

/// A volume file whose header a decoder has read.
class ApartVolume final : public VolumeReader
{
public:
    explicit ApartVolume(std::unique_ptr<ByteStore> store)
        : mStore(std::move(store))
    {
    }

    Result open(DecoderPool& pool, const QByteArray& name)
    {
        DecoderJob job;
        job.question.word = DecoderWord::Volume;
        job.question.head = bytesOf(VolumeQuestion{mStore->size()});
        job.question.data = name;
        job.mostData = kMaxHeaderBytes;
        job.mostRead = kMostRead;
        job.source = [this](qint64 offset, char* out, qint64 length) {
            const qint64 count = std::min(length, mStore->size() - offset);
            return count > 0 && mStore->read(offset, out, static_cast<std::size_t>(count)) ? count : 0;
        };
        DecoderMessage answer;
        const Result done = pool.run(DecoderKind::VolumeFiles, job, answer);
        if (done.bad())
            return done;
        if (!VolumeFile::readHeader(answer.data, mLocated))
            return Result::failure(QStringLiteral("The decoder gave a header that cannot be"));
        mHeader = mLocated.header;
        return {};
    }

    Result readSlice(int lattice, int slice, QByteArray& bytes) override
    {
        const Lattice& of = mHeader.lattices.at(lattice);
        const qint64 size = qint64(of.dims.at(0)) * of.dims.at(1) * of.components * sizeOf(of.type);
        return readChunk(mLocated.slices.at(lattice).at(slice), sizeOf(of.type), size, bytes);
    }

    Result readCounts(const QByteArray& section, QVector<quint64>& counts) override
    {
        const int at = mHeader.dataSections.indexOf(section);
        const int count = mLocated.numCounts.at(at);
        if (count == 0)
            return Result::failure(readableText(mLocated.countFaults.at(at)));
        QByteArray bytes;
        Result read =
            readChunk(mLocated.counts.at(at), int(sizeof(quint64)), count * qint64(sizeof(quint64)), bytes);
        if (read.bad())
            return read;
        counts.resize(count);
        std::memcpy(counts.data(), bytes.constData(), static_cast<std::size_t>(bytes.size()));
        return {};
    }

private:
    /// Where a chunk lies is the decoder's word, or the file's; that its bytes are whole is told by their own checksum.
    Result readChunk(const ChunkPlace& place, int elementSize, qint64 size, QByteArray& bytes)
    {
        const ChunkForm form = {elementSize, static_cast<int>(size), place.isShuffled != 0};
        Result possible = checkStored(place.size, mStore->size(), form);
        if (possible.bad())
            return possible;
        QByteArray stored(static_cast<int>(place.size), Qt::Uninitialized);
        if (!mStore->read(place.offset, stored.data(), static_cast<std::size_t>(stored.size())))
            return Result::failure(QStringLiteral("cannot be read"));
        return decodeChunk(stored, place.skippedFilters, form, bytes);
    }

    std::unique_ptr<ByteStore> mStore;
    LocatedHeader mLocated;
};

/// The file as the decoder sees it. The library reads few bytes at a time, many of them near each other.
class AskedStore final : public ReadStore
{
public:
    AskedStore(const DecoderChannel& channel, qint64 size)
        : mChannel(channel)
        , mSize(size)
    {
    }
    qint64 size() const override { return mSize; }
    bool read(qint64 at, void* bytes, std::size_t size) override
    {
        if (at < 0 || at > mSize || size > static_cast<std::size_t>(mSize - at))
            return false;
        char* to = static_cast<char*>(bytes);
        for (auto left = static_cast<qint64>(size); left > 0;) {
            const QByteArray& block = blockOf(at / kBlock);
            const auto from = static_cast<int>(at % kBlock);
            const qint64 count = std::min<qint64>(left, block.size() - from);
            if (count <= 0)
                return false;
            std::memcpy(to, block.constData() + from, static_cast<std::size_t>(count));
            to += count;
            at += count;
            left -= count;
        }
        return true;
    }

private:
    static constexpr qint64 kBlock = 4096;
    static constexpr int kMostBlocks = 256;

    const QByteArray& blockOf(qint64 number)
    {
        const auto held = mBlocks.constFind(number);
        if (held != mBlocks.constEnd())
            return *held;
        if (mBlocks.size() >= kMostBlocks)
            mBlocks.clear();
        QByteArray& block = mBlocks[number];
        block.resize(static_cast<int>(std::min(kBlock, mSize - number * kBlock)));
        block.truncate(static_cast<int>(askForBytes(mChannel, number * kBlock, block.data(), block.size())));
        return block;
    }

    const DecoderChannel& mChannel;
    qint64 mSize;
    QHash<qint64, QByteArray> mBlocks;
};

Result locate(const LibraryVolume& volume, LocatedHeader& located)
{
    located.header = volume.header();
    int left = kMaxPlaces;
    for (int i = 0; i < located.header.lattices.size(); ++i) {
        const QVector<int>& dims = located.header.lattices.at(i).dims;
        const int slices = dims.size() == 3 ? dims.at(2) : 0;
        left -= slices;
        if (left < 0)
            return Result::failure(QStringLiteral("has more than %1 slices").arg(kMaxPlaces));
        // What cannot be found stays without a place, and is a failure when somebody asks for it.
        QVector<ChunkPlace> places(slices);
        for (int slice = 0; slice < slices; ++slice)
            (void)volume.locateSlice(i, slice, places[slice]);
        located.slices.append(places);
    }
    for (const QByteArray& name : qAsConst(located.header.dataSections)) {
        ChunkPlace place;
        int count = 0;
        const Result found = volume.locateCounts(name, place, count);
        located.counts.append(place);
        located.numCounts.append(found.good() ? count : 0);
        located.countFaults.append(found.text().toUtf8().left(kMaxNameLength));
    }
    return {};
}

}  // namespace

std::unique_ptr<VolumeReader> openApart(DecoderPool& pool, std::unique_ptr<ByteStore> store,
                                        const QByteArray& name, Result& result)
{
    auto volume = std::make_unique<ApartVolume>(std::move(store));
    result = volume->open(pool, name);
    return result.good() ? std::move(volume) : nullptr;
}

DecoderMessage answerVolume(const DecoderChannel& channel, const DecoderMessage& question)
{
    DecoderMessage answer;
    VolumeQuestion asked = {};
    if (!readFrom(question.head, asked))
        return answer;
    LibraryVolume volume(std::make_unique<AskedStore>(channel, asked.size), question.data);
    LocatedHeader located;
    Result result = volume.open();
    if (result.good())
        result = locate(volume, located);
    if (result.bad()) {
        answer.head = result.text().toUtf8().left(DecoderChannel::kMaxHead);
        return answer;
    }
    answer.word = DecoderWord::Done;
    answer.data = bytesOfHeader(located);
    return answer;
}

Result prepareVolumes()
{
    const Result loaded = loadLate(LateLibrary::VolumeFiles);
    if (loaded.bad())
        return loaded;
    // It is none, which the library finds out only once it is all there.
    Result opened;
    (void)openInside(std::make_unique<BytesToRead>(QByteArray("\x89HDF\r\n\x1a\n\2", 9) + QByteArray(600, 0)),
                     "nothing", opened);
    return opened.bad() ? Result() : Result::failure(QStringLiteral("it takes anything for a volume file"));
}

}  // namespace Kdd::VolumeFile
