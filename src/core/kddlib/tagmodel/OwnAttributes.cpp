#include "kddlib/tagmodel/OwnAttributes.h"

#include "kddlib/tagmodel/TagMap.h"

namespace Kdd
{

QByteArray filePathOf(const TagMap& image)
{
    QByteArray path;
    image.findAndGetString(kFilePath, path);
    return path;
}

const TagMap* describingImage(const TagMap& node)
{
    const bool isStudy = node.parent() == nullptr;
    const TagMap* first = nullptr;
    QByteArray firstPath;
    for (const TagMap* child : node.children()) {
        const TagMap* image = isStudy ? describingImage(*child) : child;
        if (image == nullptr)
            continue;
        const QByteArray path = filePathOf(*image);
        if (first == nullptr || path < firstPath) {
            first = image;
            firstPath = path;
        }
    }
    return first;
}

QByteArray forwardSlashes(QByteArray path)
{
    return path.replace('\\', '/');
}

}  // namespace Kdd
