#pragma once

#include "platform/base/Result.h"
#include "platform/os/ExclusiveFile.h"
#include "platform/os/JournaledWrite.h"

#include <QByteArray>
#include <QFile>
#include <QString>

namespace Kdd
{

/// The file that a study is kept in, open under its lock. It holds bytes; what they say is for others to know.
///
/// Whoever changes the file holds it exclusively from before it is read until after it is written, and readers share
/// it, so nobody sees it half-written. Every write goes to the journal beside the file first; whoever opens the file next
/// finishes what a process that died left undone (`recover`).
class StudyFile
{
public:
    /// What the file is opened for.
    enum class Access {
        Read,         ///< beside other readers; tried for 0.4 s
        ReadWaiting,  ///< the same, tried for as long as the site's settings say (`ExResource::readPatience`)
        Hold,         ///< alone, to be read and written; tried for 0.4 s
        HoldWaiting,  ///< the same, tried for as long as the site's settings say
        HoldOrMake,   ///< alone, and made empty with its folder when it is absent; tried for 0.4 s
        WriteOrMake,  ///< the same, tried for 2 s: what is to be written was expensive to make
    };

    StudyFile() = default;
    StudyFile(const StudyFile&) = delete;
    StudyFile& operator=(const StudyFile&) = delete;

    /// Opens the file, which must not be open, and takes its lock. The failure NotFound of an access that makes the file
    /// says that its folder cannot be made. Closing the file ends the lock.
    LockedOpenResult open(const QString& path, Access access);

    bool isOpen() const { return mFile.isOpen(); }
    bool isEmpty() const { return mFile.size() == 0; }

    /// Where it was opened last; stays when it is closed.
    const QString& path() const { return mPath; }

    /// From its beginning on when nothing was read yet.
    QIODevice& device() { return mFile; }

    /// Its whole content, from the beginning on.
    QByteArray content();

    /// Whether the last writer did not come to its end, so that a reader may be looking at a torn file.
    bool hasJournal() const { return Kdd::hasJournal(mPath); }

    /// Finishes what the last writer did not. The file must be held alone; it stands at its beginning afterwards. On
    /// failure the journal and its promise stay.
    Result recover();

    /// Writes the content over the beginning of the file, which must be held alone. On failure the file is untouched or
    /// has a journal, and stays open.
    Result write(const QByteArray& content, Tail tail);

    /// Deletes the file, held alone, with its journal, and closes it.
    Result remove();

    /// Deletes and closes the file, held alone, when nothing was ever written to it, so that nothing is left behind of
    /// one that was made in vain.
    void removeIfNeverWritten();

    void close() { mFile.close(); }

private:
    QFile mFile;
    QString mPath;
};

/// Makes a folder for what is kept of a study, with all above it; its name is flushed where writes are, for they would be of no
/// use without it. False when it cannot be made.
bool makeStudyFolder(const QString& path);

}  // namespace Kdd
