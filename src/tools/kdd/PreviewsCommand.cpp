#include "tools/kdd/Commands.h"
#include "tools/kdd/Database.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Store.h"
#include "tools/kdd/ToolModule.h"

#include <QDir>

#include <kddlib/LogFile.h>

#include <cstdio>
#include <memory>

namespace Kdd
{

namespace
{

struct PreviewsRequest
{
    QList<QByteArray> names;  ///< the studies, and last the folder
    bool all = false;
    QString sheet;  ///< file of the contact sheet; empty for none
};

Outcome runPreviews(const GlobalOptions& options, const PreviewsRequest& request)
{
    QList<QByteArray> named = request.names;
    // The parser cannot tell studies and folder apart. There is a last value, since one is required.
    const QString folder = pathOf(named.takeLast());
    // With --all there is the folder alone, without it one study at least.
    if (request.all != named.isEmpty()) {
        LogFile::errorf("Name the studies whose previews to export, or --all");
        return Outcome::WrongUsage;
    }
    const std::unique_ptr<Kxg::Catalogue> database = openExistingDatabase();
    QVector<QByteArray> studyUIDs;
    if (database == nullptr)
        return Outcome::Failed;
    if (!QDir().mkpath(folder)) {
        LogFile::errorf("Could not create folder %s", qUtf8Printable(folder));
        return Outcome::Failed;
    }
    // The previews of studies that are found are exported, also when another study is not.
    bool isDone = chooseStudies(*database, named, request.all, studyUIDs);
    int exported = 0;
    for (const QByteArray& studyUID : qAsConst(studyUIDs)) {
        TagFile file;
        if (readStudyFile(studyUID, file))
            exported += file.exportPreviews(folder);
        else
            isDone = false;
    }
    if (!request.sheet.isEmpty()) {
        // Of all pictures in the folder, those of earlier runs included.
        const ToolModule* module = toolModule();
        isDone = module != nullptr && succeeded(module->writeContactSheet(folder, request.sheet)) && isDone;
    }
    if (options.json)
        printJson({{QStringLiteral("previews"), exported}});
    else if (!options.quiet)
        std::printf("%d previews of %d studies in %s\n", exported, studyUIDs.size(), qUtf8Printable(folder));
    return isDone ? Outcome::Done : Outcome::Failed;
}

}  // namespace

void declarePreviews(CommandSet& commands)
{
    const CommandText text = {"previews", kLooking, "Export the previews of studies",
                              "One JPEG file for each image that has a preview, in the folder named last, "
                              "which is made when it is not there.",
                              "kdd previews --all pictures --sheet all.png\n"
                              "kdd previews 2.25.2062 pictures"};
    const auto request = std::make_shared<PreviewsRequest>();
    ArgumentList arguments = commands.declare(
        text, [request](const GlobalOptions& options) { return runPreviews(options, *request); });
    arguments.texts({"NAMES", kStudiesAndFolder, "The studies, and last the folder to write to", true},
                    request->names, "UID... DIR");
    arguments.flag("--all", request->all, "Every study; then name the folder only");
    arguments.path({"--sheet", kFile, "Also put all pictures of the folder into this one picture"},
                   request->sheet);
}

}  // namespace Kdd
