#include "kddlib/items/PlainFiles.h"

#include "kddlib/items/PlainSource.h"
#include "kddlib/tagmodel/TagMap.h"

#include <utility>

namespace Kdd
{

namespace
{

/// Opened at once by each thread.
constexpr int kFilesAtOnce = 8;

/// Most headers fit into it whole.
constexpr qint64 kHead = 16 * 1024;

PlainRead readOpen(const RandomAccessFile& file, unsigned int maxLength)
{
    PlainRead read;
    read.identity = file.identity();
    LocalSource source(file);
    read.isPlain = readPlainFile(source, maxLength, read.image);
    return read;
}

}  // namespace

PlainRead readPlain(const QByteArray& path, unsigned int maxLength)
{
    RandomAccessFile file;
    return file.open(path.constData()).good() ? readOpen(file, maxLength) : PlainRead();
}

PlainFiles::PlainFiles(QList<QByteArray> paths, int threads, unsigned int maxLength)
    : mPaths(std::move(paths))
    , mMaxLength(maxLength)
    , mWork((mPaths.size() + kFilesAtOnce - 1) / kFilesAtOnce, threads,
            [this](int number) { return readPortion(number); })
{
}

PlainRead PlainFiles::next()
{
    if (mNext == mPortion.size()) {
        mPortion = mWork.next();
        mNext = 0;
    }
    return std::move(mPortion.at(mNext++));
}

PlainFiles::Portion PlainFiles::readPortion(int number) const
{
    const int first = number * kFilesAtOnce;
    const int count = qMin(kFilesAtOnce, mPaths.size() - first);
    RandomAccessFile files[kFilesAtOnce];
    bool isOpen[kFilesAtOnce] = {};
    for (int i = 0; i < count; ++i) {
        isOpen[i] = files[i].open(mPaths.at(first + i).constData()).good();
        if (isOpen[i])
            files[i].askFor(0, kHead);
    }
    Portion portion(static_cast<std::size_t>(count));
    for (int i = 0; i < count; ++i) {
        if (isOpen[i])
            portion[static_cast<std::size_t>(i)] = readOpen(files[i], mMaxLength);
    }
    return portion;
}

}  // namespace Kdd
