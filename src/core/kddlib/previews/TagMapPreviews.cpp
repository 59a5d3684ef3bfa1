#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/Volume.h"

#include <dcmtk/dcmdata/dcdeftag.h>

#include <algorithm>

namespace Kdd
{

namespace
{

QByteArray previewOf(const TagMap& node)
{
    const TagElement* preview = node.findElement(kPreview);
    return preview != nullptr ? preview->value() : QByteArray();
}

/// The volume with a preview that has the most slices, of several the first; null when there is none.
const Volume* largestVolume(const QList<TagMap*>& series)
{
    const Volume* largest = nullptr;
    for (const TagMap* one : series) {
        for (const Volume* volume : one->volumes()) {
            if (volume->hasPreview() && (largest == nullptr || volume->dims().z > largest->dims().z))
                largest = volume;
        }
    }
    return largest;
}

/// The image that a volume's preview shows: it is made of the middle slice.
TagMap* middleImage(const Volume& volume)
{
    int frame = 0;
    return volume.imageForSlice(volume.dims().z / 2, frame);
}

QList<TagMap*> inOrderOfNumber(QList<TagMap*> series)
{
    const auto number = [](const TagMap* one) {
        int value = 0;
        one->findAndGetInt(DCM_SeriesNumber, value);
        return value;
    };
    std::stable_sort(series.begin(), series.end(),
                     [&](const TagMap* a, const TagMap* b) { return number(a) < number(b); });
    return series;
}

}  // namespace

QByteArray TagMap::findPreviewData(TagMap** owner)
{
    TagMap* found = this;
    QByteArray preview = previewOf(*this);
    const bool isStudy = mParent == nullptr;
    const bool isSeries = !isStudy && mParent->mParent == nullptr;
    // Only a study or a series looks below itself: an image without preview has nothing there.
    if (preview.isEmpty() && (isStudy || (isSeries && !mChildren.isEmpty()))) {
        if (const Volume* volume = largestVolume(isStudy ? mChildren : QList<TagMap*>{this})) {
            preview = volume->previewData();
            found = middleImage(*volume);
        } else {
            const QList<TagMap*> asked = isStudy ? inOrderOfNumber(mChildren) : mChildren;
            for (int i = 0; i < asked.size() && preview.isEmpty(); ++i)
                preview = asked.at(i)->findPreviewData(&found);
        }
    }
    if (owner != nullptr)
        *owner = preview.isEmpty() ? nullptr : found;
    return preview;
}

}  // namespace Kdd
