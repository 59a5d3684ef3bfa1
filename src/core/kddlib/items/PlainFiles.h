#pragma once

#include "kddlib/items/FileHeads.h"
#include "kddlib/items/PlainFile.h"
#include "platform/base/OrderedWork.h"
#include "platform/os/RandomAccessFile.h"

#include <QByteArray>
#include <QList>

#include <memory>

namespace Kdd
{

/// A file that was looked at by `readPlainFile`.
struct PlainRead
{
    FileIdentity identity;  ///< as it was when it was opened
    bool isPlain = false;   ///< else nothing is said of it; it may even not be there
    PlainImage image;
};

/// The same for one file.
PlainRead readPlain(const QByteArray& path, unsigned int maxLength);

/// Reads files one after the other, their heads on several threads ahead of being asked for. Images are made of them by the
/// thread that asks: memory that one thread takes and another gives back, piece by piece, costs both more than the making.
/// Used by one thread.
class PlainFiles
{
public:
    /// `threads` as in `ThreadShare`.
    PlainFiles(QList<QByteArray> paths, int threads, unsigned int maxLength);

    /// What the next file is; to be called once for each path, in their order.
    PlainRead next();

private:
    std::unique_ptr<FileHeads> fetch(int portion);

    const QList<QByteArray> mPaths;
    const unsigned int mMaxLength;
    std::unique_ptr<FileHeads> mHeads;
    int mNext = 0;  // of all files
    SpareHeads mSpare;
    OrderedWork<std::unique_ptr<FileHeads>> mWork;  // last, because its threads use the rest
};

}  // namespace Kdd
