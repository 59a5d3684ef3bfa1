#include "kddlib/tagfile/StoredStudy.h"

#include "kddlib/tagfile/StampedInput.h"
#include "kddlib/tagfile/format/StudyReader.h"
#include "kddlib/tagfile/format/StudyWriter.h"
#include "platform/base/LogFile.h"
#include "platform/base/Stopwatch.h"
#include "platform/os/FileStatus.h"
#include "platform/os/PathName.h"

#include <QCryptographicHash>
#include <QDataStream>

#include <cerrno>

namespace Kdd
{

void StoredStudy::clear()
{
    mTree.clear();
    // The times of reading and writing tell of the file, not of what is held.
    Figures cleared;
    cleared.readMs = mFigures.readMs;
    cleared.writeMs = mFigures.writeMs;
    mFigures = cleared;
}

void StoredStudy::optimizeAll()
{
    using Mode = TagFileSettings::CompressionMode;
    QByteArray content;
    if (TagFileSettings::debugOption(TagFileSettings::kMeasureUnoptimised))
        // Serialized for its size alone, which only those who asked for it pay for.
        mFigures.unoptimisedSize = serialize(Mode::None, content).good() ? content.size() : 0;
    const Stopwatch stopwatch;
    mTree.optimize();
    mFigures.optimiseMs = stopwatch.elapsed();
}

// ---- reading

Result StoredStudy::read(const QString& path, const char* studyUID, bool keepOpen, Reader reader)
{
    return readThrough(mFile.device(), path, studyUID, keepOpen, reader);
}

Result StoredStudy::readStamped(const QString& path, const char* studyUID)
{
    mStamp = {};
    StampedInput input(mFile.device());
    Result result = readThrough(input, path, studyUID, false, Reader::Serving);
    if (result.good())
        mStamp = input.stamp();
    return result;
}

Result StoredStudy::readContent(const QString& path, const char* studyUID, QByteArray& content)
{
    mIsLockedOut = false;
    Result result = open(path, false, Reader::Serving);
    if (result.bad())
        return result;
    content = mFile.content();
    mFile.close();
    QDataStream in(content);
    return read(in, studyUID);
}

Result StoredStudy::readThrough(QIODevice& input, const QString& path, const char* studyUID, bool keepOpen,
                                Reader reader)
{
    const Stopwatch stopwatch;
    const QByteArray wanted(studyUID);  // may be that of the study that is let go of now
    mIsLockedOut = false;
    if (mFile.isOpen()) {
        LogFile::warnf("Tag file already opened");
        return Result::failure(QStringLiteral("Tag file already opened"));
    }
    clear();
    Result result = open(path, keepOpen, reader);
    if (result.bad())
        return result;
    QDataStream in(&input);
    result = read(in, studyUID != nullptr ? wanted.constData() : nullptr);
    if (result.bad() || !keepOpen)
        mFile.close();
    mFigures.readMs = stopwatch.elapsed();
    if (result.bad())
        LogFile::errorf("Could not read %s", qUtf8Printable(path));
    else if (LogFile::debugLogging())
        LogFile::printf("Cache file read in %d msec", mFigures.readMs);
    return result;
}

Result StoredStudy::read(QDataStream& in, const char* studyUID)
{
    return readFrom(in, mFile.path(), studyUID);
}

Result StoredStudy::readFrom(QDataStream& in, const QString& name, const char* studyUID)
{
    const QByteArray wanted(studyUID);  // as above
    clear();
    return readStudy(in, {name, studyUID != nullptr ? wanted.constData() : nullptr}, mTree, mFigures.sizes);
}

Result StoredStudy::failToOpen(const LockedOpenResult& opened)
{
    mIsLockedOut = opened.failure == OpenFailure::Locked;
    return opened.result();
}

/// Opens the file, alone if it is to be kept open. A reader that meets the journal of a writer that died first finishes
/// that write, for what the file holds may be torn.
Result StoredStudy::open(const QString& path, bool keepOpen, Reader reader)
{
    return keepOpen ? openToHold(path, reader) : openToRead(path, reader);
}

Result StoredStudy::openToRead(const QString& path, Reader reader)
{
    const bool isServing = reader == Reader::Serving;
    const LockedOpenResult opened =
        mFile.open(path, isServing ? StudyFile::Access::ReadWaiting : StudyFile::Access::Read);
    if (!opened) {
        Result result = failToOpen(opened);
        const bool isTold =
            mIsLockedOut ? !isServing : opened.failure != OpenFailure::NotFound || LogFile::debugLogging();
        if (isTold)
            LogFile::warnf("Could not open %s: %s", qUtf8Printable(path), qUtf8Printable(result.text()));
        return result;
    }
    if (!mFile.hasJournal()) {
        if (!mFile.isEmpty())
            return {};
        // Its maker has not come to filling it yet, so the study has no tag file at this moment.
        mFile.close();
        mIsLockedOut = true;
        return SystemResult::of(ENOENT);
    }
    // Only who holds the file alone may finish the write, and a shared lock cannot be raised without a gap.
    mFile.close();
    Result result = openToHold(path, reader);
    // Whoever serves others knows what a file means that stayed held, and tells it in his own words.
    if (result.bad() && (!mIsLockedOut || !isServing))
        LogFile::warnf("Could not open %s: %s", qUtf8Printable(path), qUtf8Printable(result.text()));
    return result;
}

Result StoredStudy::openToHold(const QString& path, Reader reader)
{
    const auto access = reader == Reader::Serving ? StudyFile::Access::HoldWaiting : StudyFile::Access::Hold;
    const LockedOpenResult opened = mFile.open(path, access);
    return opened ? finishInterruptedWrite() : failToOpen(opened);
}

Result StoredStudy::hold(const QByteArray& studyUID, IfAbsent ifAbsent)
{
    clear();
    const QString path = TagFileSettings::cacheFilePathForStudy(studyUID.constData());
    const auto access =
        ifAbsent == IfAbsent::Create ? StudyFile::Access::HoldOrMake : StudyFile::Access::Hold;
    const LockedOpenResult opened = mFile.open(path, access);
    mIsLockedOut = false;
    // A study without file has no images to be corrected: its holder finds none and changes nothing.
    if (opened.failure == OpenFailure::NotFound && ifAbsent == IfAbsent::Fail)
        return {};
    if (!opened)
        return failToOpen(opened);
    Result result = finishInterruptedWrite();
    if (result.bad() || mFile.isEmpty())
        return result;
    QDataStream in(&mFile.device());
    result = read(in, studyUID.constData());
    if (result.bad())
        mFile.close();
    return result;
}

/// What the last writer of the file, held alone now, did not bring to its end.
Result StoredStudy::finishInterruptedWrite()
{
    Result result = mFile.recover();
    if (result.good())
        return result;
    mFile.close();
    LogFile::errorf("Could not finish the interrupted write of %s: %s", qUtf8Printable(mFile.path()),
                    qUtf8Printable(result.text()));
    return result;
}

// ---- writing

Result StoredStudy::write()
{
    if (mTree.isEmpty())
        // Reached when the last image was removed from a file that is held;
        // without one there is nothing to do away with.
        return mFile.isOpen() ? mFile.remove() : Result::failure(QStringLiteral("No images to write"));
    if (!mFile.isOpen())
        return write(TagFileSettings::cacheFilePathForStudy(mTree.studyInstanceUID().constData()));
    // Readers go by the file's own lengths, so what a longer study left behind the end may stay.
    Result result = writeInto(mFile, Tail::Keep);
    mFile.close();
    return result;
}

Result StoredStudy::write(const QString& path)
{
    // Not the file held open: that is the study's own, whatever else the study is written to.
    StudyFile file;
    const LockedOpenResult opened = file.open(path, StudyFile::Access::WriteOrMake);
    mIsLockedOut = false;
    if (opened)
        return writeInto(file, Tail::Cut);
    LogFile::errorf("Could not open %s for writing", qUtf8Printable(path));
    return failToOpen(opened);
}

Result StoredStudy::write(QDataStream& out)
{
    Result result = serialize(out, TagFileSettings::compressionMode());
    if (result.bad())
        LogFile::errorf("%s", qUtf8Printable(result.text()));
    return result;
}

Result StoredStudy::serialize(QDataStream& out, TagFileSettings::CompressionMode mode)
{
    const Stopwatch stopwatch;
    Result result = writeStudy(mTree, mode, out, mFigures.sizes);
    if (result.good())
        mFigures.writeMs = stopwatch.elapsed();
    return result;
}

Result StoredStudy::serialize(TagFileSettings::CompressionMode mode, QByteArray& content)
{
    QDataStream out(&content, QIODevice::WriteOnly);
    return serialize(out, mode);
}

/// Writes the whole tree into a file that is held alone.
Result StoredStudy::writeInto(StudyFile& file, Tail tail)
{
    // All of it is made before the file is touched: what the study's reader would refuse must not reach it.
    QByteArray content;
    Result result = serialize(TagFileSettings::compressionMode(), content);
    if (result.good())
        result = file.write(content, tail);
    if (result.bad()) {
        LogFile::errorf("Could not write %s: %s", qUtf8Printable(file.path()), qUtf8Printable(result.text()));
        // An empty file that was made only for this would count as one that is just being made.
        file.removeIfNeverWritten();
        return result;
    }
    // Of the bytes themselves, by which the database later tells whether others wrote since.
    mStamp = {content.size(), QCryptographicHash::hash(content, QCryptographicHash::Md5)};
    FileStatus written;
    if (statusOf(pathBytes(file.path()).constData(), written)) {
        mStamp.fileSize = written.size;
        mStamp.modified = written.modified;
    }
    if (LogFile::debugLogging())
        LogFile::printf("Written tag file %s in %d msec", qUtf8Printable(file.path()), mFigures.writeMs);
    return result;
}

}  // namespace Kdd
