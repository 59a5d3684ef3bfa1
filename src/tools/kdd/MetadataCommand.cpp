#include "tools/kdd/Commands.h"
#include "tools/kdd/NodeLookup.h"

#include <kddlib/DicomJson.h>
#include <kddlib/TagMap.h>

#include <iostream>

namespace Kdd
{

namespace
{

/// Where a web service would offer what the image's metadata leaves out.
std::string bulkDataRoot(const TagMap& image)
{
    return "studies/" + image.uid(TagMap::StudyLevel).toStdString() + "/series/" +
           image.uid(TagMap::SeriesLevel).toStdString() + "/instances/" +
           image.uid(TagMap::ImageLevel).toStdString() + "/bulkdata";
}

void collectImages(const TagMap& node, QList<const TagMap*>& images)
{
    if (depthOf(node) == 2)
        images.append(&node);
    for (const TagMap* child : node.children())
        collectImages(*child, images);
}

}  // namespace

Outcome runMetadata(const GlobalOptions& /*options*/, const NodeSelection& selection)
{
    TagFile file;
    const TagMap* node = findNode(selection, file);
    if (node == nullptr)
        return Outcome::Failed;
    QList<const TagMap*> images;
    collectImages(*node, images);
    const char* separator = "[\n";
    for (const TagMap* image : qAsConst(images)) {
        std::cout << separator;
        writeDicomJson(std::cout, *image, bulkDataRoot(*image));
        separator = ",\n";
    }
    std::cout << (images.isEmpty() ? "[]\n" : "\n]\n") << std::flush;
    return Outcome::Done;
}

}  // namespace Kdd
