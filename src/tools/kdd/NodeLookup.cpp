#include "tools/kdd/NodeLookup.h"

#include "tools/kdd/Store.h"

#include <kddlib/LogFile.h>
#include <kddlib/TagMap.h>

namespace Kdd
{

TagMap* findNode(const NodeSelection& selection, TagFile& file)
{
    if (!readStudy(selection.study, file))
        return nullptr;
    TagMap* series = file.findSeries(selection.series);
    if (!selection.series.isEmpty() && series == nullptr) {
        LogFile::errorf("Study %s has no series %s", file.studyInstanceUID().constData(),
                        selection.series.constData());
        return nullptr;
    }
    // The deepest node that is named is the one that is meant.
    if (selection.image.isEmpty())
        return selection.series.isEmpty() ? file.study().get() : series;
    TagMap* image = file.findImage(selection.image);
    // Looked for in the whole study, and then held against the series that was named.
    if (image != nullptr && (selection.series.isEmpty() || image->parent() == series))
        return image;
    LogFile::errorf("Study %s has no image %s%s%s", file.studyInstanceUID().constData(),
                    selection.image.constData(), selection.series.isEmpty() ? "" : " in series ",
                    selection.series.constData());
    return nullptr;
}

int depthOf(const TagMap& node)
{
    int depth = 0;
    for (const TagMap* above = node.parent(); above != nullptr; above = above->parent())
        ++depth;
    return depth;
}

std::string bulkDataRoot(const TagMap& node)
{
    const int depth = depthOf(node);
    std::string root = "studies/" + node.uid(TagMap::StudyLevel).toStdString();
    if (depth > 0)
        root += "/series/" + node.uid(TagMap::SeriesLevel).toStdString();
    if (depth > 1)
        root += "/instances/" + node.uid(TagMap::ImageLevel).toStdString();
    return root + "/bulkdata";
}

}  // namespace Kdd
