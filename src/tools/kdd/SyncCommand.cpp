#include "platform/base/LogFile.h"
#include "tools/kdd/Commands.h"
#include "tools/kdd/Database.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Store.h"
#include "tools/kdd/StudyBuild.h"

#include <cstdio>

namespace Kdd
{

Outcome runSync(const GlobalOptions& options, const QByteArray& study)
{
    const std::unique_ptr<Kxg::Catalogue> database = openDatabase();
    QByteArray studyUID;
    if (database == nullptr || !resolveStudy(*database, study, studyUID))
        return Outcome::Failed;
    // Nobody else may change the file between its reading and its writing.
    const std::unique_ptr<Kxg::StudyClaim> claim = claimStudy(*database, studyUID);
    TagFile file;
    if (claim == nullptr || !file.readAndSync(studyUID.constData(), nullptr))
        return Outcome::Failed;
    file.optimizeAll();
    if (!file.writeCacheFile()) {
        LogFile::errorf("Study %s is not changed: %s", studyUID.constData(), qUtf8Printable(file.failure()));
        return Outcome::Failed;
    }
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
