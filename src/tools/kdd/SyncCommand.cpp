#include "tools/kdd/Commands.h"
#include "tools/kdd/Database.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Store.h"

#include <kddlib/StudyChange.h>
#include <kddlib/TagFile.h>

#include <cstdio>

namespace Kdd
{

Outcome runSync(const GlobalOptions& options, const QByteArray& study)
{
    const std::unique_ptr<Kxg::Catalogue> database = openExistingDatabase();
    QByteArray studyUID;
    TagFile file;
    if (database == nullptr || !resolveStudy(*database, study, studyUID) ||
        !StudyChange(*database).synchronise(studyUID, file))
        return Outcome::Failed;
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

}  // namespace Kdd
