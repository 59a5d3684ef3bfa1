#include "tools/kdd/CommandProgress.h"
#include "tools/kdd/Commands.h"
#include "tools/kdd/Database.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Store.h"

#include <kddlib/LogFile.h>
#include <kddlib/StudyCheck.h>

#include <cstdio>

namespace Kdd
{

Outcome runVerify(const GlobalOptions& options, const StudySelection& selection)
{
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
    const QByteArray finished = QByteArray::number(findings.studies) + " studies are verified";
    isDone = !toldOfInterrupt(finished.constData()) && isDone;
    return isDone && findings.differences == 0 && findings.unreadable == 0 ? Outcome::Done : Outcome::Failed;
}

}  // namespace Kdd
