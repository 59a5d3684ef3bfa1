#include "tools/kdd/CommandProgress.h"
#include "tools/kdd/Database.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Selection.h"
#include "tools/kdd/Store.h"

#include <kddlib/LogFile.h>
#include <kddlib/StudyCheck.h>

#include <cstdio>
#include <memory>

namespace Kdd
{

namespace
{

Outcome runVerify(const GlobalOptions& options, const StudySelection& selection)
{
    // All studies may take hours, so they are asked for by name.
    if (selection.all != selection.studies.isEmpty()) {
        LogFile::errorf("Name the studies to verify, or --all");
        return Outcome::WrongUsage;
    }
    const std::unique_ptr<Kxg::Catalogue> database = openExistingDatabase();
    QVector<QByteArray> studyUIDs;
    if (database == nullptr)
        return Outcome::Failed;
    bool isDone = selection.all || chooseStudies(*database, selection.studies, false, studyUIDs);
    CommandProgress progress("Verifying", !options.quiet);
    StudyCheck check(*database, progress,
                     [](const QString& fault) { LogFile::errorf("%s", qUtf8Printable(fault)); });
    // Also the tag files of which the database knows nothing.
    if (selection.all)
        check.checkAll();
    for (const QByteArray& studyUID : qAsConst(studyUIDs)) {
        if (!progress.isCancelled())
            check.check(studyUID);
    }
    const CheckFindings& findings = check.findings();
    if (options.json) {
        printJson({{QStringLiteral("studies"), findings.studies},
                   {QStringLiteral("images"), findings.images},
                   {QStringLiteral("differences"), findings.differences},
                   {QStringLiteral("unreadable"), findings.unreadable}});
    } else if (!options.quiet) {
        std::printf("%d studies, %d images: %d differences, %d unreadable\n", findings.studies,
                    findings.images, findings.differences, findings.unreadable);
    }
    // Studies that were not reached are not verified, so an interrupt is a failure.
    const QByteArray finished = QByteArray::number(findings.studies) + " studies are verified";
    isDone = !toldOfInterrupt(finished.constData()) && isDone;
    return isDone && findings.differences == 0 && findings.unreadable == 0 ? Outcome::Done : Outcome::Failed;
}

}  // namespace

void declareVerify(CommandSet& commands)
{
    const CommandText text = {"verify", kChecking,
                              "Hold tag files against the DICOM files they were made from",
                              "Every attribute of every image is compared, corrections taken into account, "
                              "and the tag files are held against the database. Nothing is changed. Each "
                              "difference is named; the exit code is 1 when there is one.",
                              "kdd verify --all\n"
                              "kdd --json verify 2.25.2062            # counts for a script"};
    const auto request = std::make_shared<StudySelection>();
    ArgumentList arguments = commands.declare(
        text, [request](const GlobalOptions& options) { return runVerify(options, *request); });
    request->addTo(arguments);
}

}  // namespace Kdd
