#include "tools/kdd/Commands.h"
#include "tools/kdd/ContactSheet.h"
#include "tools/kdd/Database.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Store.h"

#include <QDir>

#include <kddlib/LogFile.h>

#include <cstdio>

namespace Kdd
{

Outcome runPreviews(const GlobalOptions& options, const PreviewsRequest& request)
{
    if (request.selection.all != request.selection.studies.isEmpty()) {
        LogFile::errorf("Name the studies whose previews to export, or --all");
        return Outcome::WrongUsage;
    }
    const std::unique_ptr<Kxg::Catalogue> database = openExistingDatabase();
    QVector<QByteArray> studyUIDs;
    if (database == nullptr)
        return Outcome::Failed;
    if (!QDir().mkpath(request.folder)) {
        LogFile::errorf("Could not create folder %s", qUtf8Printable(request.folder));
        return Outcome::Failed;
    }
    bool isDone = chooseStudies(*database, request.selection.studies, request.selection.all, studyUIDs);
    int exported = 0;
    for (const QByteArray& studyUID : qAsConst(studyUIDs)) {
        TagFile file;
        if (readStudyFile(studyUID, file))
            exported += file.exportPreviews(request.folder);
        else
            isDone = false;
    }
    if (!request.sheet.isEmpty()) {
        const Result result = writeContactSheet(request.folder, request.sheet);
        isDone = succeeded(result) && isDone;
    }
    if (options.json)
        printJson({{QStringLiteral("previews"), exported}});
    else if (!options.quiet)
        std::printf("%d previews of %d studies in %s\n", exported, studyUIDs.size(),
                    qUtf8Printable(request.folder));
    return isDone ? Outcome::Done : Outcome::Failed;
}

}  // namespace Kdd
