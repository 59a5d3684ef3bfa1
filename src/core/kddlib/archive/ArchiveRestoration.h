#pragma once

#include "kddlib/archive/WorkObserver.h"
#include "platform/base/Export.h"
#include "platform/base/Result.h"

#include <QByteArray>
#include <QList>
#include <QSet>

namespace Kxg
{
class Catalogue;
struct StudyContents;
}  // namespace Kxg

namespace Kdd
{

class TagFile;

/// Looks for what the parts of an archive do not know of each other after they were restored from backups of different
/// ages: database, tag files and DICOM files. Files that the database does not know are registered; then a build of what
/// `requestStale` finds brings the tag files into line, and adopts the corrections that only they tell of.
///
/// What was removed from the database stays removed, as far as the database that is there now can know. Used by the thread
/// of its catalogue.
class KDD_EXPORT ArchiveRestoration
{
public:
    /// Both must outlive the object.
    ArchiveRestoration(Kxg::Catalogue& catalogue, WorkObserver& observer)
        : mCatalogue(catalogue)
        , mObserver(observer)
    {
    }

    struct Totals
    {
        int taken = 0;    ///< files that the database did not know
        int absent = 0;   ///< files that it lists and that are not there, or cannot be taken in
        int foreign = 0;  ///< tag files of studies of which there is nothing else
    };

    /// `objects` is the folder of those that arrived over a network. Each study of which something is taken in or absent is
    /// told in the log. Failure: that of the database.
    Result run(const QByteArray& objects, Totals& totals);

private:
    Result findObjects(const QByteArray& folder, QSet<QByteArray>& unknown);
    Result findNamed(QSet<QByteArray>& unknown);
    Result look(const TagFile& file, const Kxg::StudyContents& contents, QSet<QByteArray>& unknown);
    Result take(const QList<QByteArray>& files, Totals& totals);
    Result countAbsent(Totals& totals);

    Kxg::Catalogue& mCatalogue;
    WorkObserver& mObserver;
    QList<QByteArray> mForeign;  // studies
};

}  // namespace Kdd
