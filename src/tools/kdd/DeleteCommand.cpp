#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "tools/kdd/Commands.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Store.h"

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

}  // namespace

Outcome runDelete(const GlobalOptions& options, const NodeSelection& selection)
{
    QByteArray studyUID;
    if (!resolveStudy(selection.study, studyUID))
        return Outcome::Failed;
    TagFile file;
    if (!file.readCacheFileForStudy(studyUID.constData(), true)) {
        LogFile::errorf("Study %s cannot be changed: %s", studyUID.constData(),
                        qUtf8Printable(file.failure()));
        return Outcome::Failed;
    }
    const int removed = removeSelected(selection, file);
    if (removed == 0) {
        LogFile::errorf("Study %s has no %s %s", studyUID.constData(),
                        selection.image.isEmpty() ? "series" : "image",
                        (selection.image.isEmpty() ? selection.series : selection.image).constData());
        return Outcome::Failed;
    }
    if (!file.writeCacheFile()) {
        LogFile::errorf("Study %s is not changed: %s", studyUID.constData(), qUtf8Printable(file.failure()));
        return Outcome::Failed;
    }
    if (options.json)
        printJson({{QStringLiteral("deleted"), removed}});
    return Outcome::Done;
}

}  // namespace Kdd
