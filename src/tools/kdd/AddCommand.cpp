#include "tools/kdd/CommandProgress.h"
#include "tools/kdd/Database.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Selection.h"
#include "tools/kdd/Store.h"

#include <QJsonArray>

#include <kddlib/FileScan.h>
#include <kddlib/StudyIntake.h>

#include <cstdio>
#include <memory>

namespace Kdd
{

namespace
{

StudyTotals sumOf(const QMap<QByteArray, StudyTotals>& studies)
{
    StudyTotals all;
    for (const StudyTotals& study : studies) {
        all.series += study.series;
        all.images += study.images;
        all.volumes += study.volumes;
    }
    return all;
}

void printTotals(const QMap<QByteArray, StudyTotals>& studies)
{
    QList<QStringList> rows{{QStringLiteral("STUDY"), QStringLiteral("SERIES "), QStringLiteral("IMAGES "),
                             QStringLiteral("VOLUMES "), QStringLiteral("DICOM "), QStringLiteral("HEADERS "),
                             QStringLiteral("TAG FILE ")}};
    for (auto it = studies.cbegin(); it != studies.cend(); ++it) {
        const StudyTotals& study = it.value();
        rows.append({displayText(it.key()), QString::number(study.series), QString::number(study.images),
                     QString::number(study.volumes), humanBytes(study.fileBytes),
                     humanBytes(study.headerBytes), humanBytes(study.tagFileBytes)});
    }
    // A heading without rows says nothing that the line of the totals does not say.
    if (rows.size() > 1)
        printTable(rows);
}

/// Also after a failure: what was taken until then is taken.
void report(const GlobalOptions& options, const FileScan& scan, const StudyIntake& intake)
{
    const QMap<QByteArray, StudyTotals>& studies = intake.studies();
    const StudyTotals all = sumOf(studies);
    // To whoever asked it is one list, whether a file could not be read or what was in it could not be taken.
    std::vector<RefusedFile> refused = scan.refused();
    refused.insert(refused.end(), intake.refused().begin(), intake.refused().end());
    const int failed = static_cast<int>(refused.size());
    if (options.json) {
        QJsonObject result{{QStringLiteral("studies"), studies.size()},
                           {QStringLiteral("series"), all.series},
                           {QStringLiteral("images"), all.images},
                           {QStringLiteral("volumes"), all.volumes},
                           {QStringLiteral("unchanged"), scan.unchanged()},
                           {QStringLiteral("skipped"), scan.skipped()},
                           {QStringLiteral("failed"), failed}};
        if (failed > 0)
            result.insert(QStringLiteral("failures"), jsonOf(refused));
        printJson(result);
    } else if (!options.quiet) {
        printTotals(studies);
        std::printf(
            "%d studies, %d series, %d images, %d volumes; %d files unchanged, %d skipped, %d failed\n",
            studies.size(), all.series, all.images, all.volumes, scan.unchanged(), scan.skipped(), failed);
    }
}

Outcome runAdd(const GlobalOptions& options, const ScanRequest& request)
{
    QList<QByteArray> paths;
    Outcome outcome = Outcome::Done;
    if (!request.collect(paths, outcome))
        return outcome;
    const std::unique_ptr<Kxg::Catalogue> database = openDatabase();
    if (database == nullptr)
        return Outcome::Failed;
    CommandProgress progress("Taking", !options.quiet);
    FileScan scan(*database, progress);
    // The archive may lie below the paths, and must not take in what it keeps itself.
    scan.setOwnPlaces(ownPlaces(options));
    scan.setNamesSkipped(options.verbose);
    scan.setDamage(request.tolerant ? Damage::Tolerated : Damage::Refused);
    scan.setReaders(request.jobs);
    // Gathers what the scan hands on, so that a study is completed once for all its files.
    StudyIntake intake(*database, progress);
    Result taken = scan.run(paths, [&](DicomInput input) { return intake.take(std::move(input)); });
    if (taken.good())
        taken = intake.finish();
    // Unchanged files may be those of an earlier run that was ended before their studies were complete.
    if (taken.good() && scan.unchanged() > 0)
        taken = intake.completeWaiting(paths);
    const bool isDone = succeeded(taken);
    report(options, scan, intake);
    const QByteArray finished = QByteArray::number(intake.studies().size()) + " studies are complete";
    // An interrupt is told in any case, also when something else failed.
    const bool isWhole =
        !toldOfInterrupt(finished.constData()) && scan.refused().empty() && intake.refused().empty();
    return isDone && isWhole ? Outcome::Done : Outcome::Failed;
}

}  // namespace

void declareAdd(CommandSet& commands)
{
    const CommandText text = {
        "add", kTaking, "Take the DICOM and volume files below the paths into database and tag files",
        "What a server does when images arrive: every file that is new or changed is registered in the image "
        "database, and the tag file of each study that gained or lost one is built or completed. Files that "
        "are neither DICOM nor volume files are passed over; --verbose names them. Objects behind addresses "
        "are "
        "read by their headers, many at once, and stay where they are.",
        "kdd add day                            # a folder\n"
        "kdd --json add day/*/*                 # counts for a script\n"
        "kdd add --tolerant day --verbose       # also of damaged files what is sound"};
    // Filled while the command line is read and used when the command runs, which is later than this
    // function.
    const auto request = std::make_shared<ScanRequest>();
    ArgumentList arguments =
        commands.declare(text, [request](const GlobalOptions& options) { return runAdd(options, *request); });
    request->addTo(arguments);
}

}  // namespace Kdd
