#include "tools/kdd/CommandProgress.h"
#include "tools/kdd/Commands.h"
#include "tools/kdd/Database.h"
#include "tools/kdd/Report.h"

#include <kddlib/LogFile.h>
#include <kddlib/StudyBuilders.h>

#include <cstdio>

namespace Kdd
{

namespace
{

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

}  // namespace

Outcome runBuild(const GlobalOptions& options, const BuildRequest& request)
{
    if (request.selection.all && !request.selection.studies.isEmpty()) {
        LogFile::errorf("Name the studies to build, or --all");
        return Outcome::WrongUsage;
    }
    const std::unique_ptr<Kxg::Catalogue> database = openExistingDatabase();
    QVector<QByteArray> named;
    int expected = 0;
    if (database == nullptr || !chooseStudies(*database, request.selection.studies, false, named) ||
        (request.settle && !succeeded(database->settleNow())) ||
        (request.selection.all && !requestStale(*database, request.again)) ||
        !succeeded(database->countWaiting(expected)))
        return Outcome::Failed;
    CommandProgress progress("Building", !options.quiet);
    StudyBuilders builders(progress, request.jobs, request.optimize);
    const BuildTotals totals = named.isEmpty() ? builders.buildWaiting(expected) : builders.build(named);
    report(options, totals);
    const QByteArray finished = QByteArray::number(totals.studies) + " studies are built";
    return !toldOfInterrupt(finished.constData()) && totals.failed == 0 ? Outcome::Done : Outcome::Failed;
}

}  // namespace Kdd
