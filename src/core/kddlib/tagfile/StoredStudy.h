#pragma once

#include "kddlib/tagfile/StudyFile.h"
#include "kddlib/tagfile/StudyTree.h"
#include "kddlib/tagfile/TagFileSettings.h"
#include "kddlib/tagfile/format/FileSizes.h"
#include "platform/base/Result.h"
#include "platform/database/TagFileStamp.h"

#include <QByteArray>
#include <QString>

class QDataStream;

namespace Kdd
{

/// A study's tree with its file: reads the one from the other, writes it back, and merges into what others wrote. What
/// `TagFile` and corrections are made of.
///
/// Every operation that fails leaves the file as it was or finished by its journal.
class StoredStudy
{
public:
    enum class Reader {
        Ordinary,  ///< would rather do without than wait
        Serving,   ///< others wait for it, who would rather wait than get nothing
    };

    /// Times [ms] of the last optimisation, reading and writing, and sizes [bytes].
    struct Figures
    {
        FileSizes sizes;
        int optimiseMs = 0;
        int readMs = 0;
        int writeMs = 0;
        int unoptimisedSize = 0;
    };

    StudyTree& tree() { return mTree; }
    const StudyTree& tree() const { return mTree; }

    /// The file held open, or last held.
    StudyFile& file() { return mFile; }
    const Figures& figures() const { return mFigures; }

    /// Of the file written last, or read with `readStamped`; empty before.
    const Kxg::TagFileStamp& stamp() const { return mStamp; }

    /// Whether the last opening failed because others held the file all the time, or were just making it.
    bool wasLockedOut() const { return mIsLockedOut; }

    /// Lets go of the tree. The file stays open.
    void clear();

    void optimizeAll();

    /// Reads the file at `path`; with `studyUID` not null only that study. With `keepOpen` the file is held alone and
    /// stays open.
    Result read(const QString& path, const char* studyUID, bool keepOpen, Reader reader);
    Result read(QDataStream& in, const char* studyUID);

    /// The same for others who wait for it, with the stamp of the bytes that were read.
    Result readStamped(const QString& path, const char* studyUID);

    /// The same with all the bytes of the file, those included that are left over behind what the tree was made of.
    Result readContent(const QString& path, const char* studyUID, QByteArray& content);

    /// Holds the study's file alone and reads it. An absent or empty file holds no study, which is no failure.
    Result hold(const QByteArray& studyUID, IfAbsent ifAbsent);

    /// Writes to the file held open and closes it, else to the study's own place. An empty tree deletes the file held
    /// open.
    Result write();
    Result write(const QString& path);
    Result write(QDataStream& out);

    /// Writes to the file held open, which stays held.
    Result writeHeld() { return writeInto(mFile, Tail::Keep); }

    /// Brings the tree into the study's file, in place of images with the same UID. The tree then is the whole study.
    Result merge();

private:
    Result readThrough(QIODevice& input, const QString& path, const char* studyUID, bool keepOpen,
                       Reader reader);
    Result readFrom(QDataStream& in, const QString& name, const char* studyUID);
    Result failToOpen(const LockedOpenResult& opened);
    Result open(const QString& path, bool keepOpen, Reader reader);
    Result openToRead(const QString& path, Reader reader);
    Result openToHold(const QString& path, Reader reader);
    Result finishInterruptedWrite();

    Result serialize(QDataStream& out, TagFileSettings::CompressionMode mode);
    Result serialize(TagFileSettings::CompressionMode mode, QByteArray& content);
    Result writeInto(StudyFile& file, Tail tail);

    Result openToMerge(StudyFile& file, const QString& path);
    Result readToMerge(StudyFile& file, const QByteArray& studyUID);

    StudyFile mFile;  // outlives the tree: others may have it when all is let go of
    StudyTree mTree;
    Figures mFigures;
    Kxg::TagFileStamp mStamp;
    bool mIsLockedOut = false;
};

}  // namespace Kdd
