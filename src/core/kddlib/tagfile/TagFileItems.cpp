#include "kddlib/items/kdditemtm.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/TagMap.h"

namespace Kdd
{

std::shared_ptr<Item> TagFile::findImageEx(const QByteArray& sopUID, const QByteArray& suffix) const
{
    TagMap* image = findImage(sopUID, suffix);
    if (image == nullptr)
        return nullptr;
    const auto study = mStudies.constFind(image->uid(TagMap::StudyLevel));
    return study != mStudies.cend() ? std::make_shared<ItemTM>(*image, *study) : nullptr;
}

}  // namespace Kdd
