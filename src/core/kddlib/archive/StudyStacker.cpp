#include "kddlib/archive/StudyStacker.h"

#include "kddlib/archive/ArchiveDatabase.h"
#include "kddlib/archive/ContentDigest.h"
#include "kddlib/archive/FileWalk.h"
#include "kddlib/archive/StudyCompletion.h"
#include "kddlib/tagfile/StudyFile.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/StackWriter.h"
#include "platform/base/LogFile.h"
#include "platform/os/FileStatus.h"
#include "platform/os/PathName.h"
#include "platform/os/StagedFile.h"

#include <unistd.h>

#include <utility>

namespace Kdd
{

namespace
{

/// Below the folder of volumes as the tag files lie below theirs.
QString folderOf(const QByteArray& studyUID, const QString& volumes)
{
    const QString tagFile = TagFile::cacheFilePathForStudy(studyUID.constData());
    const QString place = tagFile.mid(pathText(TagFile::metaFolder()).size());
    return pathText(absolutePath(pathBytes(volumes))) + QLatin1Char('/') +
           place.left(place.lastIndexOf(QLatin1Char('.')));
}

}  // namespace

StudyStacker::StudyStacker(Kxg::Catalogue& catalogue, StackOptions options)
    : mCatalogue(catalogue)
    , mOptions(std::move(options))
{
}

bool StudyStacker::stack(const QByteArray& studyUID)
{
    mStudyUID = studyUID;
    mFolder = folderOf(studyUID, mOptions.folder);
    mKnown.clear();
    mMade = {};
    mIsChanged = false;
    mSeries.clear();
    std::unique_ptr<Kxg::StudyClaim> claim;
    if (!succeeded(claimStudy(mCatalogue, studyUID, claim)))
        return false;
    // What was made or removed is built in, also when another
    // series failed: the database knows of it already.
    const bool isDone = run();
    return (!mIsChanged || succeeded(StudyCompletion(mCatalogue).build(*claim).result)) && isDone;
}

/// A series that fails does not keep the others from being stacked; what was made is registered in any case.
bool StudyStacker::run()
{
    removeUnfinished();
    TagFile file;
    if (!file.readWhenFreeForStudy(mStudyUID.constData(), false)) {
        LogFile::errorf("Study %s cannot be stacked: %s", mStudyUID.constData(),
                        qUtf8Printable(file.failure()));
        return false;
    }
    if (!succeeded(mCatalogue.volumeFiles(mStudyUID, mKnown)))
        return false;
    bool isDone = true;
    for (auto it = file.seriesByUID().cbegin(); it != file.seriesByUID().cend(); ++it)
        isDone = stackSeries(it.key(), *it.value()) && isDone;
    if (mMade.volumes.empty())
        return isDone;
    mIsChanged = true;
    Kxg::RegistrationOutcome outcome;
    return succeeded(mCatalogue.registerFiles(mMade, outcome)) &&
           succeeded(digestRegistered(mCatalogue, mMade)) && isDone;
}

/// What a process that died while it wrote has left. The claim says that nobody writes there now.
void StudyStacker::removeUnfinished() const
{
    QStringList faults;  // mostly there is no such folder
    for (const QByteArray& path : filesBelow({pathBytes(mFolder)}, faults)) {
        if (path.endsWith(".part"))
            ::unlink(path.constData());
    }
}

bool StudyStacker::stackSeries(const QByteArray& seriesUID, const TagMap& series)
{
    mSeries.append(StackedSeries{seriesUID, {}, {}, false});
    StackedSeries& told = mSeries.last();
    if (!clearSeries(seriesUID, series, told.hadVolumes))
        return false;
    if (told.hadVolumes)
        return true;
    const StackPlan plan = planStacks(series, mOptions.reference);
    for (const LeftOutFrame& leftOut : plan.leftOut)
        ++told.reasons[leftOut.reason];
    bool isDone = true;
    int index = 0;
    for (const Stack& stack : plan.stacks) {
        if (!succeeded(writeVolume(seriesUID, stack, index))) {
            isDone = false;
            continue;
        }
        // Numbers without gaps, because the volumes that were made here are found again by counting up.
        ++index;
        told.volumes.append(QString::asprintf("%d x %d x %d at %.4g mm", stack.dims.x, stack.dims.y,
                                              stack.dims.z, stack.sliceSpacing));
    }
    return isDone;
}

/// A series that has volumes keeps them. Only those that were made here can be made again; then they go first, for
/// there may be fewer this time.
bool StudyStacker::clearSeries(const QByteArray& seriesUID, const TagMap& series, bool& isStacked)
{
    QVector<QByteArray> ours;
    for (int i = 0; mKnown.contains(volumePath(seriesUID, i)); ++i)
        ours.append(volumePath(seriesUID, i));
    isStacked = ours.isEmpty() ? !series.volumes().isEmpty() : !mOptions.again;
    if (ours.isEmpty() || isStacked)
        return true;
    // The database first, so that it does not list files that are gone.
    if (!succeeded(mCatalogue.removeFiles(ours)))
        return false;
    mIsChanged = true;
    for (const QByteArray& path : ours)
        ::unlink(path.constData());
    return true;
}

Result StudyStacker::writeVolume(const QByteArray& seriesUID, const Stack& stack, int index)
{
    if (!makeStudyFolder(mFolder))
        return Result::failure(QStringLiteral("Could not create folder %1").arg(mFolder));
    const QByteArray path = volumePath(seriesUID, index);
    Result written = writeStack(stack, filePathOf, path);
    // The database will name the file, and its row is flushed always.
    if (written.good() && TagFile::durability() == TagFile::Durability::PowerLoss)
        written = Result(flushNamedFile(path)).within(QStringLiteral("cannot be flushed"));
    FileStatus status;
    if (written.good() && !statusOf(path.constData(), status))
        return Result::failure(QStringLiteral("Volume file %1 is gone again").arg(pathText(path)));
    if (written.good())
        mMade.volumes.push_back({path, {status.size, status.modified}, mStudyUID, seriesUID});
    return written;
}

QByteArray StudyStacker::volumePath(const QByteArray& seriesUID, int index) const
{
    return pathBytes(mFolder) + '/' + volumeFileName(seriesUID, index);
}

}  // namespace Kdd
