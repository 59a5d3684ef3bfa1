#pragma once

#include "kddlib/items/PlainFile.h"
#include "platform/base/OrderedWork.h"
#include "platform/os/RandomAccessFile.h"

#include <QByteArray>
#include <QList>

#include <vector>

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

/// Reads files one after the other, on several threads ahead of being asked for. The heads of the next few are asked for
/// before one is read, so that a disk or a server far away works on several at a time. Used by one thread.
class PlainFiles
{
public:
    /// `threads` as in `ThreadShare`.
    PlainFiles(QList<QByteArray> paths, int threads, unsigned int maxLength);

    /// What the next file is; to be called once for each path, in their order.
    PlainRead next();

private:
    using Portion = std::vector<PlainRead>;

    Portion readPortion(int number) const;

    const QList<QByteArray> mPaths;
    const unsigned int mMaxLength;
    Portion mPortion;
    std::size_t mNext = 0;       // in the portion
    OrderedWork<Portion> mWork;  // last, because its threads use the rest
};

}  // namespace Kdd
