#include "tools/kdd/Database.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Selection.h"
#include "tools/kdd/Store.h"

#include <kddlib/StudyChange.h>

namespace Kdd
{

namespace
{

/// A beginning is enough for the study; a series or an image is named in full.
Outcome runDelete(const GlobalOptions& options, const NodeSelection& selection)
{
    QByteArray studyUID;
    const std::unique_ptr<Kxg::Catalogue> database = openExistingDatabase();
    if (database == nullptr || !resolveStudy(*database, selection.study, studyUID) ||
        !succeeded(StudyChange(*database).remove({studyUID, selection.series, selection.image})))
        return Outcome::Failed;
    // One node is named, so one is what was deleted.
    if (options.json)
        printJson({{QStringLiteral("deleted"), 1}});
    return Outcome::Done;
}

}  // namespace

void declareDelete(CommandSet& commands)
{
    const CommandText text = {"delete", kChanging, "Delete a study's tag file, a series or an image",
                              "The database forgets the images and the tag file loses them. The DICOM files "
                              "stay where they are; adding them again brings the images back.",
                              "kdd delete 2.25.2062 --image 2.25.118095209191961083373906363074726608325\n"
                              "kdd delete 2.25.2062                   # the whole study"};
    const auto request = std::make_shared<NodeSelection>();
    ArgumentList arguments = commands.declare(
        text, [request](const GlobalOptions& options) { return runDelete(options, *request); });
    request->addTo(arguments);
}

}  // namespace Kdd
