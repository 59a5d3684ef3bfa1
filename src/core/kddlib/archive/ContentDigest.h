#pragma once

#include "platform/database/StudyProofs.h"

#include <QByteArray>
#include <QString>

#include <functional>
#include <memory>

namespace Kdd
{

/// SHA-256 of bytes that come one after the other. Of those that are to be had everywhere it is the one that processors
/// take themselves, faster than disks give the bytes, and that others can hold against theirs (`sha256sum`).
///
/// Used by one thread at a time.
class ContentDigest
{
public:
    ContentDigest();
    ~ContentDigest();
    ContentDigest(const ContentDigest&) = delete;
    ContentDigest& operator=(const ContentDigest&) = delete;

    void add(const char* bytes, qint64 count);

    /// Of what came; empty when the library for it cannot be had. To be called once, after everything else.
    QByteArray result();

private:
    struct Context;

    std::unique_ptr<Context> mContext;  // null: there is no digest
};

/// What was found when all bytes of a file were read.
struct DigestedFile
{
    enum class Fault {
        None,
        Absent,
        Unreadable,  ///< `reason` says why
        Changing,    ///< somebody wrote to it meanwhile
        Cancelled,
    };

    Fault fault = Fault::None;
    QString reason;
    Kxg::FileStamp stamp;
    QByteArray digest;
};

/// Told of bytes that were read, on the thread that reads; may take its time. False: no more is wanted.
using BytesTaken = std::function<bool(qint64 count)>;

/// Reads all of a regular file.
DigestedFile digestFile(const QByteArray& path, const BytesTaken& taken = {});

/// Takes the digests of files that were just registered and keeps them, several files at a time, where the site wants that
/// (`ExResource::takesFileDigests`). What is another file by now, cannot be read, or lies behind a URL gets none. Failure: that of
/// the database.
Result digestRegistered(Kxg::Catalogue& catalogue, const Kxg::FileRecords& files);

}  // namespace Kdd
