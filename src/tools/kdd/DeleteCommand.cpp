#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "tools/kdd/Commands.h"
#include "tools/kdd/Database.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Store.h"
#include "tools/kdd/StudyBuild.h"

#include <cstdio>

namespace Kdd
{

namespace
{

bool isInSeries(const TagMap* image, const QByteArray& seriesUID)
{
    return image != nullptr && (seriesUID.isEmpty() || image->uid(TagMap::SeriesLevel) == seriesUID);
}

/// Takes what is selected out of the file held open; the number of nodes removed.
int removeSelected(const NodeSelection& selection, TagFile& file)
{
    if (!selection.image.isEmpty() && !isInSeries(file.findImage(selection.image), selection.series))
        return 0;
    const char* image = selection.image.constData();
    const char* series = selection.series.constData();
    if (!selection.image.isEmpty())
        return file.removeImages(1, &image);
    if (!selection.series.isEmpty())
        return file.removeSeries(1, &series);
    file.clear();
    return 1;
}

/// Deleted for good: what the database goes on listing would come back with the next build.
bool forget(Kxg::Catalogue& database, const QByteArray& studyUID, const NodeSelection& selection)
{
    if (!selection.image.isEmpty())
        return succeeded(database.removeImage(studyUID, selection.image));
    if (!selection.series.isEmpty())
        return succeeded(database.removeSeries(studyUID, selection.series));
    return succeeded(database.removeStudy(studyUID));
}

bool removeFromTagFile(const QByteArray& studyUID, const NodeSelection& selection, int& removed)
{
    TagFile file;
    if (!file.readWhenFreeForStudy(studyUID.constData(), true)) {
        LogFile::errorf("Study %s cannot be changed: %s", studyUID.constData(),
                        qUtf8Printable(file.failure()));
        return false;
    }
    removed = removeSelected(selection, file);
    if (removed == 0) {
        LogFile::errorf("Study %s has no %s %s", studyUID.constData(),
                        selection.image.isEmpty() ? "series" : "image",
                        (selection.image.isEmpty() ? selection.series : selection.image).constData());
        return false;
    }
    if (file.writeCacheFile())
        return true;
    LogFile::errorf("Study %s is not changed: %s", studyUID.constData(), qUtf8Printable(file.failure()));
    return false;
}

}  // namespace

Outcome runDelete(const GlobalOptions& options, const NodeSelection& selection)
{
    QByteArray studyUID;
    const std::unique_ptr<Kxg::Catalogue> database = openDatabase();
    if (database == nullptr || !resolveStudy(selection.study, studyUID))
        return Outcome::Failed;
    QVector<QByteArray> registered;
    if (!succeeded(database->findStudies(studyUID, 1, registered)))
        return Outcome::Failed;
    const bool isRegistered = registered.contains(studyUID);
    std::unique_ptr<Kxg::StudyClaim> claim = isRegistered ? claimStudy(*database, studyUID) : nullptr;
    int removed = 0;
    if ((isRegistered && claim == nullptr) || !removeFromTagFile(studyUID, selection, removed))
        return Outcome::Failed;
    // A claim keeps its study in the database.
    claim.reset();
    if (isRegistered && !forget(*database, studyUID, selection))
        return Outcome::Failed;
    if (options.json)
        printJson({{QStringLiteral("deleted"), removed}});
    return Outcome::Done;
}

}  // namespace Kdd
