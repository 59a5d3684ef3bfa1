#include "tools/kdd/CommandProgress.h"
#include "tools/kdd/Database.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Selection.h"
#include "tools/kdd/Store.h"

#include <kddlib/FileScan.h>
#include <kddlib/Registration.h>
#include <kddlib/TagMap.h>

#include <cstdio>
#include <memory>

namespace Kdd
{

namespace
{

/// The same scan as when images are taken in, but the studies are left waiting for others to build.
Outcome runIndex(const GlobalOptions& options, const ScanRequest& request)
{
    QList<QByteArray> paths;
    Outcome outcome = Outcome::Done;
    if (!request.collect(paths, outcome))
        return outcome;
    const std::unique_ptr<Kxg::Catalogue> database = openDatabase();
    if (database == nullptr)
        return Outcome::Failed;
    CommandProgress progress("Reading", !options.quiet);
    FileScan scan(*database, progress);
    // The archive may lie below the paths, and must not take in what it keeps itself.
    scan.setOwnPlaces(ownPlaces(options));
    scan.setNamesSkipped(options.verbose);
    scan.setDamage(request.tolerant ? Damage::Tolerated : Damage::Refused);
    scan.setReaders(request.jobs);
    Registration registration(*database);
    Result registered = scan.run(paths, [&](const DicomInput& input) { return registration.add(input); });
    // The last files are still held back, as registering is done for many at once.
    if (registered.good())
        registered = registration.flush();
    // Counts are told after a failure as well: what is registered stays registered.
    const bool isDone = succeeded(registered);
    const int studies = registration.studies().size();
    const int failed = static_cast<int>(scan.refused().size());
    if (options.json) {
        QJsonObject result{{QStringLiteral("studies"), studies},
                           {QStringLiteral("images"), registration.images()},
                           {QStringLiteral("volumes"), registration.volumes()},
                           {QStringLiteral("unchanged"), scan.unchanged()},
                           {QStringLiteral("skipped"), scan.skipped()},
                           {QStringLiteral("failed"), failed}};
        if (failed > 0)
            result.insert(QStringLiteral("failures"), jsonOf(scan.refused()));
        printJson(result);
    } else if (!options.quiet) {
        std::printf(
            "%d images and %d volumes registered in %d studies; %d files unchanged, %d skipped, %d failed\n",
            registration.images(), registration.volumes(), studies, scan.unchanged(), scan.skipped(), failed);
    }
    const QByteArray finished = QByteArray::number(registration.images()) + " images are registered";
    return !toldOfInterrupt(finished.constData()) && isDone && failed == 0 ? Outcome::Done : Outcome::Failed;
}

}  // namespace

void declareIndex(CommandSet& commands)
{
    const CommandText text = {"index", kTaking,
                              "Register the DICOM and volume files below the paths in the database only",
                              "The studies then wait to be built, by `kdd build` in as many processes and on "
                              "as many machines as you like. For an archive that is there already.",
                              "kdd index day\n"
                              "kdd build --all --jobs 4               # then this builds what waits"};
    const auto request = std::make_shared<ScanRequest>();
    ArgumentList arguments = commands.declare(
        text, [request](const GlobalOptions& options) { return runIndex(options, *request); });
    request->addTo(arguments);
}

}  // namespace Kdd
