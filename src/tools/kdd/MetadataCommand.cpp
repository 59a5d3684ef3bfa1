#include "tools/kdd/NodeLookup.h"
#include "tools/kdd/Selection.h"

#include <kddlib/DicomJson.h>
#include <kddlib/TagMap.h>

#include <iostream>

namespace Kdd
{

namespace
{

/// All images at or below a node, in the order of the tree.
void collectImages(const TagMap& node, QList<const TagMap*>& images)
{
    if (depthOf(node) == 2)
        images.append(&node);
    for (const TagMap* child : node.children())
        collectImages(*child, images);
}

Outcome runMetadata(const GlobalOptions& /*options*/, const NodeSelection& selection)
{
    TagFile file;
    const TagMap* node = findNode(selection, file);
    if (node == nullptr)
        return Outcome::Failed;
    QList<const TagMap*> images;
    collectImages(*node, images);
    // Written image by image: as a whole the array may be many times as large as the study's tag file.
    DicomImageWriter writer(MetadataForm::Json);
    QByteArray text;
    const char* separator = "[\n";
    for (const TagMap* image : qAsConst(images)) {
        text = separator;
        writer.append(text, *image, QByteArray::fromStdString(bulkDataRoot(*image)));
        std::cout.write(text.constData(), text.size());
        separator = ",\n";
    }
    // Without images it is an empty array, so that the result is valid in any case.
    std::cout << (images.isEmpty() ? "[]\n" : "\n]\n") << std::flush;
    return Outcome::Done;
}

}  // namespace

void declareMetadata(CommandSet& commands)
{
    const CommandText text = {
        "metadata", kLooking, "Write images as DICOM JSON",
        "An array with one object for each image, in UTF-8, with or without --json; inherited values are "
        "included. A value that the tag file leaves out is {\"vr\": ..., \"BulkDataURI\": ...}.",
        "kdd metadata 2.25.2062 > metadata.json\n"
        "kdd metadata 2.25.2062 --image 2.25.118095209191961083373906363074726608325"};
    const auto request = std::make_shared<NodeSelection>();
    ArgumentList arguments = commands.declare(
        text, [request](const GlobalOptions& options) { return runMetadata(options, *request); });
    request->addTo(arguments);
}

}  // namespace Kdd
