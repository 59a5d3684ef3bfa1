#include "tools/kdd/CommandProgress.h"
#include "tools/kdd/Database.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Selection.h"
#include "tools/kdd/ServerSignals.h"
#include "tools/kdd/Store.h"

#include <kddlib/ArchiveRestoration.h>
#include <kddlib/Kxg.h>
#include <kddlib/LogFile.h>
#include <kddlib/StudyBuilders.h>
#include <kddlib/StudyIndexing.h>
#include <kddlib/StudyWorkers.h>

#include <cstdio>
#include <memory>

namespace Kdd
{

namespace
{

struct BuildRequest
{
    StudySelection selection;   ///< neither studies nor all: what waits to be built
    bool again = false;         ///< with all: also what has a tag file that nothing changed since
    bool settle = false;        ///< also what was merged and would wait for its time
    bool leavesPlaces = false;  ///< attributes stay where they were found
    bool search = false;        ///< makes searches know what is built, and nothing else
    bool restored = false;      ///< first takes in what only files know, after a backup was brought back
    bool endless = false;       ///< goes on when nothing is left, until it is interrupted
    int jobs = 1;
};

void report(const GlobalOptions& options, const BuildTotals& totals)
{
    if (options.json) {
        printJson({{QStringLiteral("studies"), totals.studies},
                   {QStringLiteral("images"), totals.images},
                   {QStringLiteral("volumes"), totals.volumes},
                   {QStringLiteral("failed"), totals.failed}});
    } else if (!options.quiet) {
        std::printf("%d studies built with %d images and %d volumes, %d failed\n", totals.studies,
                    totals.images, totals.volumes, totals.failed);
    }
}

/// Reads tag files only; nothing is built.
Outcome fillSearch(const GlobalOptions& options)
{
    Result opened;
    const std::unique_ptr<Kxg::StudySearch> search = Kxg::StudySearch::open(Kxg::DatabaseServer(), opened);
    if (!succeeded(opened))
        return Outcome::Failed;
    CommandProgress progress("Indexing", !options.quiet);
    StudyIndexing::Totals totals;
    const bool isDone = StudyIndexing(*search).fill(progress, totals);
    if (options.json)
        printJson({{QStringLiteral("studies"), totals.studies}, {QStringLiteral("failed"), totals.failed}});
    else if (!options.quiet)
        std::printf("%d studies are known to searches now, %d failed\n", totals.studies, totals.failed);
    const QByteArray finished = QByteArray::number(totals.studies) + " studies are indexed";
    return !toldOfInterrupt(finished.constData()) && isDone && totals.failed == 0 ? Outcome::Done
                                                                                  : Outcome::Failed;
}

/// What was found is built with all that is stale. `isWhole`: nothing was missing.
bool takeInRestored(const GlobalOptions& options, Kxg::Catalogue& database, bool& isWhole)
{
    CommandProgress progress("Looking", !options.quiet);
    ArchiveRestoration::Totals totals;
    if (!succeeded(ArchiveRestoration(database, progress).run(objectFolder(options), totals)))
        return false;
    if (!options.quiet && !options.json)
        std::printf(
            "%d files were not known and are taken in, %d files are missing, %d studies are tag files only\n",
            totals.taken, totals.absent, totals.foreign);
    isWhole = totals.absent == 0 && totals.foreign == 0;
    return true;
}

Outcome workForever(const GlobalOptions& options, const BuildRequest& request)
{
    loadForLongRun();
    const ServerSignals received;
    StudyWorkers workers(request.jobs);
    workers.start();
    LogFile::printf("Waiting for studies to build");
    // There is nothing to be read anew.
    received.awaitEnd([] {});
    workers.stop();
    if (options.json)
        printJson({{QStringLiteral("studies"), workers.completed()}});
    else if (!options.quiet)
        std::printf("%d studies completed\n", workers.completed());
    return Outcome::Done;
}

Outcome runBuild(const GlobalOptions& options, const BuildRequest& request)
{
    const bool isEverything = request.selection.all || request.restored;
    const bool isBuilding = isEverything || !request.selection.studies.isEmpty() || request.settle;
    if (request.endless && (isBuilding || request.search || request.leavesPlaces)) {
        LogFile::errorf(
            "--forever works off whatever waits: name neither studies nor another option but --jobs");
        return Outcome::WrongUsage;
    }
    if (request.endless)
        return workForever(options, request);
    if (request.search && isBuilding) {
        LogFile::errorf("--search builds nothing: name no studies, nor another option that builds, with it");
        return Outcome::WrongUsage;
    }
    if (request.search)
        return fillSearch(options);
    // With both, the names would have no effect.
    if (isEverything && !request.selection.studies.isEmpty()) {
        LogFile::errorf("Name the studies to build, or --all or --restored");
        return Outcome::WrongUsage;
    }
    if (request.again && !isEverything && request.selection.studies.isEmpty()) {
        LogFile::errorf("--again builds what is named once more: name studies, or --all");
        return Outcome::WrongUsage;
    }
    // An archive that is not there has nothing to build, so none is made.
    const std::unique_ptr<Kxg::Catalogue> database = openExistingDatabase();
    QVector<QByteArray> named;
    int expected = 0;
    bool isWhole = true;
    // In this order, so that what is asked for here is in the queue before it is counted.
    if (database == nullptr || !chooseStudies(*database, request.selection.studies, false, named) ||
        (request.settle && !succeeded(database->settleNow())) ||
        (request.restored && !takeInRestored(options, *database, isWhole)) ||
        (isEverything && !succeeded(requestStale(*database, request.again))) ||
        !succeeded(database->countWaiting(expected)))
        return Outcome::Failed;
    CommandProgress progress("Building", !options.quiet);
    StudyBuilders builders(progress, request.jobs, !request.leavesPlaces);
    // Without names the queue is worked off, which any number of processes do together.
    const BuildTotals totals = named.isEmpty() ? builders.buildWaiting(expected) : builders.build(named);
    report(options, totals);
    // What was built stays, and what was not goes on waiting.
    const QByteArray finished = QByteArray::number(totals.studies) + " studies are built";
    return !toldOfInterrupt(finished.constData()) && totals.failed == 0 && isWhole ? Outcome::Done
                                                                                   : Outcome::Failed;
}

}  // namespace

void declareBuild(CommandSet& commands)
{
    const CommandText text = {
        "build", kTaking, "Build the tag files of studies that wait for it, or of those named",
        "Reads all files of a study anew. Without UIDs and --all, what waits is built; --all adds studies "
        "whose tag file is missing, damaged or not the one that was written last. Several processes share "
        "the work.",
        "kdd build                              # what waits\n"
        "kdd build --all --again --jobs 4       # everything, four studies at once\n"
        "kdd build 2.25.2062                    # a unique beginning of the UID is enough\n"
        "kdd build --forever --jobs 2           # a worker beside servers, until it is interrupted\n"
        "kdd build --search                     # once, for an archive of an earlier release"};
    const auto request = std::make_shared<BuildRequest>();
    ArgumentList arguments = commands.declare(
        text, [request](const GlobalOptions& options) { return runBuild(options, *request); });
    request->selection.addTo(arguments);
    arguments.flag("--again", request->again, "With --all: also those whose files did not change");
    arguments.flag("--settle", request->settle,
                   "Also studies that images were merged into lately, without waiting");
    arguments.flag("--restored", request->restored,
                   "As --all, after looking for files that a restored database does not know");
    arguments.flag("--forever", request->endless,
                   "Build whatever comes to wait, until interrupted; what is at hand is ended");
    arguments.flag("--no-optimize", request->leavesPlaces, "Leave every attribute where it was found");
    arguments.flag("--search", request->search,
                   "Build nothing; make searches know studies that were built before there were any");
    arguments.number("--jobs", 1, 256, request->jobs, "Studies built at once");
}

}  // namespace Kdd
