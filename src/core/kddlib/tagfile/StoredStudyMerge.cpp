#include "kddlib/tagfile/StoredStudy.h"
#include "kddlib/tagfile/StudyMerge.h"
#include "platform/base/LogFile.h"
#include "platform/os/PathName.h"

#include <QDataStream>
#include <QFileInfo>

#include <utility>

namespace Kdd
{

namespace
{

const char* const kCategory = "TagMerge";

Result failMerge(const QString& reason)
{
    LogFile::tracef(3, kCategory, "%s", qUtf8Printable(reason));
    return Result::failure(reason);
}

}  // namespace

Result StoredStudy::merge()
{
    mIsLockedOut = false;
    if (mTree.isEmpty()) {
        LogFile::tracef(2, kCategory, "No images, cannot update tag file");
        return Result::failure(QStringLiteral("No images, cannot update tag file"));
    }
    const QByteArray studyUID = mTree.studyInstanceUID();
    // Held from before it is read until after it is written: what others merge meanwhile would be lost.
    StudyFile file;
    Result result = openToMerge(file, TagFileSettings::cacheFilePathForStudy(studyUID.constData()));
    // In an empty file there is nothing to merge with: these images are the study.
    if (result.bad() || file.isEmpty())
        return result.good() ? writeInto(file, Tail::Keep) : result;
    StudyTree fresh;
    std::swap(mTree, fresh);
    result = readToMerge(file, studyUID);
    if (result.bad()) {
        std::swap(mTree, fresh);
        return result;
    }
    // From here on the tree is the whole study, also when it cannot be written:
    // the caller may try again and loses nothing.
    StudyMerge(mTree, fresh).run();
    return writeInto(file, Tail::Keep);
}

/// Opens the study's file alone, made with its folder when it is missing.
Result StoredStudy::openToMerge(StudyFile& file, const QString& path)
{
    const LockedOpenResult opened = file.open(path, StudyFile::Access::WriteOrMake);
    mIsLockedOut = opened.failure == OpenFailure::Locked;
    if (opened.failure == OpenFailure::NotFound)
        return failMerge(
            QString::asprintf("Could not create meta folder %s", qUtf8Printable(QFileInfo(path).path())));
    if (!opened)
        return failMerge(QString::asprintf("Could not open %s for read-write: error code %lu",
                                           qUtf8Printable(path),
                                           static_cast<unsigned long>(opened.systemError)));
    Result result = file.recover();
    return result.good() ? result : failMerge(result.text());
}

/// Reads the file into the tree, which is left empty on failure.
Result StoredStudy::readToMerge(StudyFile& file, const QByteArray& studyUID)
{
    QDataStream in(&file.device());
    Result result = readFrom(in, file.path(), studyUID.constData());
    if (result.good())
        return result;
    // The reader passes other studies over; only reading without asking for one tells that there is another.
    file.device().seek(0);
    QDataStream again(&file.device());
    const bool holdsAnother = readFrom(again, file.path(), nullptr).good();
    clear();
    const QByteArray name = pathBytes(file.path());
    return failMerge(holdsAnother ? QString::asprintf("Tag file %s contains wrong study, expected %s",
                                                      name.constData(), studyUID.constData())
                                  : QString::asprintf("Could not read tag file %s", name.constData()));
}

}  // namespace Kdd
