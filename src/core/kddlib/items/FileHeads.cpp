#include "kddlib/items/FileHeads.h"

#include <QtEndian>

#include <algorithm>
#include <cstring>

namespace Kdd
{

namespace
{

/// Pixel Data of undefined length, which has fragments, as every syntax with such has it.
constexpr char kFragments[] = "\xe0\x7f\x10\x00OB\0\0\xff\xff\xff\xff";
constexpr int kFragmentsLength = sizeof(kFragments) - 1;
constexpr int kFragmentHead = 8;
constexpr quint32 kItem = 0xe000fffe;

/// Whoever says that there are more has them looked at one by one, later.
constexpr int kMostFragments = 1000;

/// Whoever needs more than the head opens the file once more, which has to be the same still: many files that stay open would
/// leave no descriptors for others.
class FetchedSource : public PlainSource
{
public:
    FetchedSource(const char* path, const FileIdentity& identity, const char* head, qint64 count)
        : mPath(path)
        , mIdentity(identity)
        , mHead(head)
        , mCount(count)
    {
    }

    qint64 size() const override { return mIdentity.size; }

    qint64 readAt(qint64 offset, void* bytes, qint64 count) override
    {
        const bool isHere = offset >= 0 && offset <= mCount && count <= mCount - offset;
        if (isHere)
            std::memcpy(bytes, mHead + offset, static_cast<std::size_t>(count));
        return isHere ? count : readRest(offset, bytes, count);
    }

    bool isUnchanged() override { return mRest == nullptr || mRest->isUnchanged(); }

private:
    qint64 readRest(qint64 offset, void* bytes, qint64 count)
    {
        if (mRest == nullptr) {
            mRest = std::make_unique<RandomAccessFile>();
            if (mRest->open(mPath).bad() || !(mRest->identity() == mIdentity))
                mIsOther = true;
        }
        return mIsOther ? -1 : mRest->readAt(offset, bytes, count);
    }

    const char* const mPath;
    const FileIdentity mIdentity;
    const char* const mHead;
    const qint64 mCount;
    std::unique_ptr<RandomAccessFile> mRest;
    bool mIsOther = false;
};

/// Whoever reads the header looks at the heads of all fragments, to see where they end, and finds them in memory then.
void touchFragments(const RandomAccessFile& file, const char* head, qint64 count)
{
    const char* const end = head + count;
    const char* const found = std::search(head, end, kFragments, kFragments + kFragmentsLength);
    qint64 at = found - head + kFragmentsLength;
    for (int left = found == end ? 0 : kMostFragments; left > 0; --left) {
        char item[kFragmentHead];
        if (at > file.size() - kFragmentHead || file.readAt(at, item, kFragmentHead) != kFragmentHead ||
            qFromLittleEndian<quint32>(item) != kItem)
            return;
        at += kFragmentHead + qint64(qFromLittleEndian<quint32>(item + 4));
    }
}

}  // namespace

void FileHeads::fetch(const QList<QByteArray>& paths, int first, int count)
{
    RandomAccessFile files[kFiles];
    for (int i = 0; i < count; ++i) {
        Head& head = mHeads[i];
        head.path = paths.at(first + i).constData();
        head.count = files[i].open(head.path).good() ? 0 : -1;
        head.identity = files[i].identity();
        if (head.count == 0)
            files[i].askFor(0, kLength);
    }
    for (int i = 0; i < count; ++i) {
        Head& head = mHeads[i];
        if (head.count == 0)
            head.count = files[i].readAt(0, head.bytes, std::min(kLength, files[i].size()));
        touchFragments(files[i], head.bytes, std::max<qint64>(head.count, 0));
    }
}

std::unique_ptr<PlainSource> FileHeads::source(int i) const
{
    const Head& head = mHeads[i];
    if (head.count < 0)
        return nullptr;
    return std::make_unique<FetchedSource>(head.path, head.identity, head.bytes, head.count);
}

std::unique_ptr<FileHeads> SpareHeads::take()
{
    const std::lock_guard<std::mutex> lock(mMutex);
    if (mSpare.empty())
        return std::make_unique<FileHeads>();
    std::unique_ptr<FileHeads> heads = std::move(mSpare.back());
    mSpare.pop_back();
    return heads;
}

void SpareHeads::give(std::unique_ptr<FileHeads> heads)
{
    const std::lock_guard<std::mutex> lock(mMutex);
    mSpare.push_back(std::move(heads));
}

}  // namespace Kdd
