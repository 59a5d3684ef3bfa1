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

QByteArray forwardSlashes(QByteArray path)
{
    return path.replace('\\', '/');
}

}  // namespace Kdd
