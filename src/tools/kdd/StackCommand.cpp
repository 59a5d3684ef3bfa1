#include "tools/kdd/CommandProgress.h"
#include "tools/kdd/Database.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Selection.h"

#include <QJsonArray>

#include <kddlib/StudyStacker.h>

#include <cstdio>
#include <memory>

namespace Kdd
{

namespace
{

struct StackRequest
{
    StudySelection selection;
    bool again = false;  ///< also series that have volume files already
    bool ignoresFrameOfReference = false;
};

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

Outcome runStack(const GlobalOptions& options, const StackRequest& request)
{
    const std::unique_ptr<Kxg::Catalogue> database = openExistingDatabase();
    QVector<QByteArray> studyUIDs;
    const bool wantsAll = request.selection.all || request.selection.studies.isEmpty();
    if (database == nullptr)
        return Outcome::Failed;
    // What is found is stacked, also when another study is not.
    bool isDone = chooseStudies(*database, request.selection.studies, wantsAll, studyUIDs);
    QJsonArray told;
    int volumes = 0;
    int studies = 0;
    CommandProgress progress("Stacking", !options.quiet);
    StudyStacker stacker(
        *database, {options.volumeFolder(), request.again,
                    request.ignoresFrameOfReference ? FrameOfReference::Ignored : FrameOfReference::Shared});
    for (const QByteArray& studyUID : qAsConst(studyUIDs)) {
        // Asked between studies, so that none is left half stacked.
        if (progress.isCancelled())
            break;
        // In this order: a study that fails does not keep the next one from being stacked.
        isDone = stacker.stack(studyUID) && isDone;
        for (const StackedSeries& series : stacker.series()) {
            volumes += series.volumes.size();
            // Kept until the end, since the result is one value.
            told.append(jsonOf(series));
            if (!options.json && !options.quiet)
                print(series);
        }
        progress.progress(++studies, studyUIDs.size());
    }
    if (options.json)
        printJson({{QStringLiteral("volumes"), volumes}, {QStringLiteral("series"), told}});
    else if (!options.quiet)
        std::printf("%d volumes made\n", volumes);
    const QByteArray finished = QByteArray::number(studies) + " studies are stacked";
    return !toldOfInterrupt(finished.constData()) && isDone ? Outcome::Done : Outcome::Failed;
}

}  // namespace

void declareStack(CommandSet& commands)
{
    const CommandText text = {
        "stack", kTaking, "Make volume files from the series that can be stacked",
        "The volume files stand in the store and are registered. Without UIDs every study is looked at. Of "
        "each series that gives no volume, or leaves images out, the reason is told.",
        "kdd stack                              # every study\n"
        "kdd stack 2.25.2062 --again            # anew what has volumes already"};
    const auto request = std::make_shared<StackRequest>();
    ArgumentList arguments = commands.declare(
        text, [request](const GlobalOptions& options) { return runStack(options, *request); });
    request->selection.addTo(arguments);
    arguments.flag("--again", request->again, "Also series that have volume files already");
    arguments.flag("--ignore-frame-of-reference", request->ignoresFrameOfReference,
                   "Also stack slices that have different Frames of Reference, as anonymisers leave them");
}

}  // namespace Kdd
