#include "tools/kdd/Database.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Selection.h"
#include "tools/kdd/Store.h"

#include <kddlib/StudyChange.h>
#include <kddlib/TagFile.h>

#include <cstdio>
#include <memory>

namespace Kdd
{

namespace
{

Outcome runSync(const GlobalOptions& options, const QByteArray& study)
{
    const std::unique_ptr<Kxg::Catalogue> database = openExistingDatabase();
    QByteArray studyUID;
    TagFile file;
    if (database == nullptr || !resolveStudy(*database, study, studyUID) ||
        !succeeded(StudyChange(*database).synchronise(studyUID, file)))
        return Outcome::Failed;
    // Counted in the study as it is stored now.
    const TagFile::Statistics statistics = file.statistics();
    if (options.json) {
        printJson(
            {{QStringLiteral("series"), statistics.series}, {QStringLiteral("images"), statistics.images}});
    } else if (!options.quiet) {
        std::printf("Study %s has %d series and %d images\n", studyUID.constData(), statistics.series,
                    statistics.images);
    }
    return Outcome::Done;
}

}  // namespace

void declareSync(CommandSet& commands)
{
    const CommandText text = {
        "sync", kChanging, "Bring a study's tag file into line with the database",
        "Paths, names and series become those of the database. No DICOM file is opened.",
        "kdd sync 2.25.2062"};
    const auto request = std::make_shared<QByteArray>();
    ArgumentList arguments = commands.declare(
        text, [request](const GlobalOptions& options) { return runSync(options, *request); });
    arguments.text(kOneStudy, *request);
}

}  // namespace Kdd
