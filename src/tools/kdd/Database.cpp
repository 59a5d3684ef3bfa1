#include "tools/kdd/Database.h"

#include "tools/kdd/Store.h"

#include <kddlib/Kxg.h>
#include <kddlib/LogFile.h>

namespace Kdd
{

std::unique_ptr<Kxg::Catalogue> openDatabase()
{
    return openCatalogue();
}

std::unique_ptr<Kxg::Catalogue> openExistingDatabase()
{
    Result result;
    std::unique_ptr<Kxg::Catalogue> database = Kxg::Catalogue::openExisting(Kxg::DatabaseServer(), result);
    if (result.bad())
        LogFile::errorf("There is no archive here: %s", qUtf8Printable(result.text()));
    return database;
}

bool chooseStudies(Kxg::Catalogue& database, const QList<QByteArray>& named, bool all,
                   QVector<QByteArray>& studyUIDs)
{
    if (all) {
        std::vector<Kxg::StudySummary> studies;
        if (!succeeded(database.listStudies(studies)))
            return false;
        // Where only volume files are left, because corrections moved the images away, there is nothing to work on.
        for (const Kxg::StudySummary& study : studies) {
            if (study.images > 0)
                studyUIDs.append(study.studyInstanceUID);
        }
        return true;
    }
    // All names are looked up before it fails, so that every fault is told at once.
    bool allFound = true;
    for (const QByteArray& text : named) {
        QByteArray studyUID;
        if (!resolveStudy(database, text, studyUID))
            allFound = false;
        // Whoever names a study twice has it worked on once.
        else if (!studyUIDs.contains(studyUID))
            studyUIDs.append(studyUID);
    }
    return allFound;
}

}  // namespace Kdd
