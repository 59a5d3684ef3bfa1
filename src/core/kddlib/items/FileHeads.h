#pragma once

#include "kddlib/items/PlainSource.h"
#include "platform/os/RandomAccessFile.h"

#include <QByteArray>
#include <QList>

#include <memory>
#include <mutex>
#include <vector>

namespace Kdd
{

/// The first bytes of a few files, as they were when they were fetched. Nothing stays open.
class FileHeads
{
public:
    static constexpr int kFiles = 8;              // at most
    static constexpr qint64 kLength = 16 * 1024;  // of which most headers need no more [bytes]

    /// Opens `count` files from `paths.at(first)` on, asks for all of their heads before it reads one, so that a disk or a
    /// server far away works on several at a time, and also for what else the header of an image needs whose pixels are
    /// compressed. The paths must outlive what is asked afterwards.
    void fetch(const QList<QByteArray>& paths, int first, int count);

    /// The file of number `i`, from 0 on, by what was fetched of it, which must outlive the answer; null when it could not be
    /// opened or read.
    std::unique_ptr<PlainSource> source(int i) const;

    /// Of that file, when there is a source.
    const FileIdentity& identity(int i) const { return mHeads[i].identity; }

private:
    struct Head
    {
        const char* path = nullptr;
        FileIdentity identity;
        qint64 count = -1;  ///< of the bytes that are here; -1: none can be had
        char bytes[kLength];
    };

    Head mHeads[kFiles];
};

/// Heads that are used again: each is a piece of memory as large as to be given back to the system each time.
class SpareHeads
{
public:
    std::unique_ptr<FileHeads> take();
    void give(std::unique_ptr<FileHeads> heads);

private:
    std::mutex mMutex;  // of what follows
    std::vector<std::unique_ptr<FileHeads>> mSpare;
};

}  // namespace Kdd
