#include "kddlib/items/PlainFiles.h"

#include "kddlib/tagmodel/TagMap.h"

#include <utility>

namespace Kdd
{

PlainRead readPlain(const QByteArray& path, unsigned int maxLength)
{
    RandomAccessFile file;
    PlainRead read;
    if (file.open(path.constData()).bad())
        return read;
    read.identity = file.identity();
    LocalSource source(file);
    read.isPlain = readPlainFile(source, maxLength, read.image);
    return read;
}

PlainFiles::PlainFiles(QList<QByteArray> paths, int threads, unsigned int maxLength)
    : mPaths(std::move(paths))
    , mMaxLength(maxLength)
    , mWork((mPaths.size() + FileHeads::kFiles - 1) / FileHeads::kFiles, threads,
            [this](int portion) { return fetch(portion); })
{
}

PlainRead PlainFiles::next()
{
    const int i = mNext++ % FileHeads::kFiles;
    if (i == 0) {
        if (mHeads != nullptr)
            mSpare.give(std::move(mHeads));
        mHeads = mWork.next();
    }
    PlainRead read;
    if (const std::unique_ptr<PlainSource> source = mHeads->source(i)) {
        read.identity = mHeads->identity(i);
        read.isPlain = readPlainFile(*source, mMaxLength, read.image);
    }
    return read;
}

std::unique_ptr<FileHeads> PlainFiles::fetch(int portion)
{
    std::unique_ptr<FileHeads> heads = mSpare.take();
    const int first = portion * FileHeads::kFiles;
    heads->fetch(mPaths, first, qMin(FileHeads::kFiles, mPaths.size() - first));
    return heads;
}

}  // namespace Kdd
