#include "tools/kdd/Commands.h"
#include "tools/kdd/Database.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Store.h"

#include <kddlib/StudyChange.h>

namespace Kdd
{

Outcome runDelete(const GlobalOptions& options, const NodeSelection& selection)
{
    QByteArray studyUID;
    const std::unique_ptr<Kxg::Catalogue> database = openExistingDatabase();
    if (database == nullptr || !resolveStudy(*database, selection.study, studyUID) ||
        !StudyChange(*database).remove({studyUID, selection.series, selection.image}))
        return Outcome::Failed;
    if (options.json)
        printJson({{QStringLiteral("deleted"), 1}});
    return Outcome::Done;
}

}  // namespace Kdd
