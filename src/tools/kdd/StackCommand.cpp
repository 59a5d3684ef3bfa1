#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/StackPlanner.h"
#include "kddlib/volumes/StackWriter.h"
#include "platform/base/LogFile.h"
#include "platform/os/FileStatus.h"
#include "platform/os/PathName.h"
#include "tools/kdd/Commands.h"
#include "tools/kdd/Database.h"
#include "tools/kdd/Progress.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Store.h"
#include "tools/kdd/StudyBuild.h"

#include <QJsonArray>

#include <unistd.h>

#include <cstdio>
#include <filesystem>
#include <utility>

namespace Kdd
{

namespace
{

/// What is told of one series.
struct StackedSeries
{
    QByteArray uid;
    QStringList volumes;         ///< "512 x 512 x 100 at 2.5 mm"
    QMap<QString, int> reasons;  ///< why images are in none, and how many
    bool hadVolumes = false;
};

/// Makes and registers the volume files of one study, which is claimed.
class StudyStacker
{
public:
    StudyStacker(Kxg::Catalogue& database, QString folder, const StackRequest& request)
        : mDatabase(database)
        , mFolder(std::move(folder))
        , mAgain(request.again)
        , mReference(request.ignoresFrameOfReference ? FrameOfReference::Ignored : FrameOfReference::Shared)
    {
    }

    /// False when anything failed, which is logged. Volumes that were made are registered nevertheless.
    bool run(const QByteArray& studyUID);

    /// Whether the tag file has to be built because of it.
    bool isChanged() const { return mIsChanged; }

    const QList<StackedSeries>& series() const { return mSeries; }

private:
    bool stackSeries(const QByteArray& seriesUID, const TagMap& series);
    bool clearSeries(const QByteArray& seriesUID, const TagMap& series, bool& isStacked);
    bool writeVolume(const QByteArray& seriesUID, const Stack& stack, int index);

    QByteArray volumePath(const QByteArray& seriesUID, int index) const
    {
        return pathBytes(mFolder) + '/' + volumeFileName(seriesUID, index);
    }

    Kxg::Catalogue& mDatabase;
    QString mFolder;
    bool mAgain;
    FrameOfReference mReference;
    QByteArray mStudyUID;
    QVector<QByteArray> mKnown;  // volume files of the study
    Kxg::FileRecords mMade;
    bool mIsChanged = false;
    QList<StackedSeries> mSeries;
};

bool StudyStacker::run(const QByteArray& studyUID)
{
    mStudyUID = studyUID;
    TagFile file;
    if (!readStudyFile(TagFile::cacheFilePathForStudy(mStudyUID.constData()), file) ||
        !succeeded(mDatabase.volumeFiles(mStudyUID, mKnown)))
        return false;
    bool isDone = true;
    for (auto it = file.seriesByUID().cbegin(); it != file.seriesByUID().cend(); ++it)
        isDone = stackSeries(it.key(), *it.value()) && isDone;
    if (mMade.volumes.empty())
        return isDone;
    mIsChanged = true;
    QMap<QByteArray, qint64> requests;
    return succeeded(mDatabase.registerFiles(mMade, requests)) && isDone;
}

bool StudyStacker::stackSeries(const QByteArray& seriesUID, const TagMap& series)
{
    mSeries.append(StackedSeries{seriesUID, {}, {}, false});
    StackedSeries& told = mSeries.last();
    if (!clearSeries(seriesUID, series, told.hadVolumes))
        return false;
    if (told.hadVolumes)
        return true;
    const StackPlan plan = planStacks(series, mReference);
    for (const LeftOutFrame& leftOut : plan.leftOut)
        ++told.reasons[leftOut.reason];
    bool isDone = true;
    int index = 0;
    for (const Stack& stack : plan.stacks) {
        if (!writeVolume(seriesUID, stack, index)) {
            isDone = false;
            continue;
        }
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
    isStacked = ours.isEmpty() ? !series.volumes().isEmpty() : !mAgain;
    if (ours.isEmpty() || isStacked)
        return true;
    if (!succeeded(mDatabase.removeFiles(ours)))
        return false;
    mIsChanged = true;
    for (const QByteArray& path : ours)
        ::unlink(path.constData());
    return true;
}

bool StudyStacker::writeVolume(const QByteArray& seriesUID, const Stack& stack, int index)
{
    if (!makeFolder(mFolder)) {
        LogFile::errorf("Could not create folder %s", qUtf8Printable(mFolder));
        return false;
    }
    const QByteArray path = volumePath(seriesUID, index);
    FileStatus status;
    if (!succeeded(writeStack(stack, filePathOf, path)) || !statusOf(path.constData(), status))
        return false;
    mMade.volumes.push_back({path, {status.size, status.modified}, mStudyUID, seriesUID});
    return true;
}

bool stackStudy(Kxg::Catalogue& database, const QByteArray& studyUID, StudyStacker& stacker)
{
    std::unique_ptr<Kxg::StudyClaim> claim = claimStudy(database, studyUID);
    const bool isDone = claim != nullptr && stacker.run(studyUID);
    if (!stacker.isChanged())
        return isDone;
    // Claimed anew, so that what stacking itself left in the queue is done with the building.
    claim.reset();
    claim = claimStudy(database, studyUID);
    TagFile file;
    return claim != nullptr && buildStudy(*claim, true, file) && isDone;
}

/// Below the folder of volumes as the tag files lie below theirs.
QString volumeFolder(const GlobalOptions& options, const QByteArray& studyUID)
{
    const QString tagFile = TagFile::cacheFilePathForStudy(studyUID.constData());
    const QString place = tagFile.mid(pathText(TagFile::metaFolder()).size());
    const std::filesystem::path store =
        std::filesystem::absolute(pathBytes(options.store).toStdString()).lexically_normal();
    return pathText(QByteArray::fromStdString((store / "volumes").native())) + QLatin1Char('/') +
           place.left(place.lastIndexOf(QLatin1Char('.')));
}

QJsonObject jsonOf(const StackedSeries& series)
{
    QJsonObject reasons;
    for (auto it = series.reasons.cbegin(); it != series.reasons.cend(); ++it)
        reasons.insert(it.key(), it.value());
    return {{QStringLiteral("series"), displayText(series.uid)},
            {QStringLiteral("volumes"), QJsonArray::fromStringList(series.volumes)},
            {QStringLiteral("leftOut"), reasons},
            {QStringLiteral("hadVolumes"), series.hadVolumes}};
}

void print(const StackedSeries& series)
{
    std::printf("%s: %s\n", qUtf8Printable(displayText(series.uid)),
                series.hadVolumes          ? "has volumes already"
                : series.volumes.isEmpty() ? "no volume"
                                           : qUtf8Printable(series.volumes.join(QStringLiteral(", "))));
    for (auto it = series.reasons.cbegin(); it != series.reasons.cend(); ++it)
        std::printf("    %d left out: %s\n", it.value(), qUtf8Printable(it.key()));
}

}  // namespace

Outcome runStack(const GlobalOptions& options, const StackRequest& request)
{
    const std::unique_ptr<Kxg::Catalogue> database = openDatabase();
    QVector<QByteArray> studyUIDs;
    const bool wantsAll = request.selection.all || request.selection.studies.isEmpty();
    if (database == nullptr)
        return Outcome::Failed;
    bool isDone = chooseStudies(*database, request.selection.studies, wantsAll, studyUIDs);
    QJsonArray told;
    int volumes = 0;
    Progress progress("Stacking", !options.quiet);
    for (int i = 0; i < studyUIDs.size(); ++i) {
        StudyStacker stacker(*database, volumeFolder(options, studyUIDs.at(i)), request);
        isDone = stackStudy(*database, studyUIDs.at(i), stacker) && isDone;
        for (const StackedSeries& series : stacker.series()) {
            volumes += series.volumes.size();
            told.append(jsonOf(series));
            if (!options.json && !options.quiet)
                print(series);
        }
        progress.show(i + 1, studyUIDs.size());
    }
    if (options.json)
        printJson({{QStringLiteral("volumes"), volumes}, {QStringLiteral("series"), told}});
    else if (!options.quiet)
        std::printf("%d volumes made\n", volumes);
    return isDone ? Outcome::Done : Outcome::Failed;
}

}  // namespace Kdd
