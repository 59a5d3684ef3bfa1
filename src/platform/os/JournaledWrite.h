#pragma once

#include "platform/os/SystemResult.h"

#include <QByteArray>
#include <QString>

class QFile;

// Rewriting a file in place so that a crash never leaves it torn. All functions expect a file that is held under
// the exclusive lock (see ExclusiveFile.h) except where said otherwise; the lock is kept.
//
// The new content first goes to a journal beside the file, then into the file, then the journal is removed. So at
// every moment either the file is whole or the journal is complete, and a complete journal is a promise that
// whoever opens the file next writes that content. The journal (all integers unsigned and little-endian):
//
//     offset  size  field
//     0       8     "KDDJRNL1"
//     8       8     n, the length of the content [bytes]
//     16      4     CRC-32 of the content (the polynomial of zlib)
//     20      n     the content; the journal ends with it

namespace Kdd
{

/// What a finished write survives: the death of the process, or also power loss (journal, folder and file are
/// flushed to the disk in this order, which takes milliseconds).
enum class Flush { Process, Disk };

/// What becomes of old bytes behind the end of a shorter new content: they stay, for formats whose readers stop at
/// their own counts, or they are cut off.
enum class Tail { Keep, Cut };

struct WriteOptions
{
    Flush flush = Flush::Process;
    Tail tail = Tail::Keep;
};

/// `<path>.journal`
QString journalPath(const QString& path);

/// True when the last writer of the file at `path` did not come to its end. A reader that finds this under its
/// shared lock may be looking at a torn file: it should give the lock back, open exclusively and recover.
bool hasJournal(const QString& path);

/// Replaces the head of the file by `content`. A journal that an earlier writer left is recovered before.
///
/// On failure either the file is untouched (the journal could not be written, or there is no room for the content: the room is reserved before the first old byte changes),
/// or the journal stays and the next recovery finishes the write.
///
/// The system's errors are seen here and not at some later flush, because the write bypasses the buffer of
/// `locked`. What that held for writing is flushed before; afterwards it stands at offset 0 and holds nothing.
SystemResult writeInPlace(QFile& locked, const QString& path, const QByteArray& content,
                          WriteOptions options = {});

/// For everyone who has just opened `path` exclusively. A complete journal is written into the file again, and
/// removed when that is done; a damaged one is removed, for its writer had not yet touched the file. The file is not
/// cut. Leaves `locked` at offset 0.
///
/// Good when the file is whole, also when there was no journal; else the journal and its promise are kept.
SystemResult recoverInterruptedWrite(QFile& locked, const QString& path, Flush flush);

/// Deletes the file at `path` with its journal, which would otherwise bring the content back into the next file of
/// that name, and closes `locked`. The removal is flushed to the disk whatever is asked of writes: nobody would notice
/// a file that is back after a loss of power, for what it was made of is known no more.
SystemResult removeWithJournal(QFile& locked, const QString& path);

}  // namespace Kdd
