#include "kddlib/tagfile/qa/QAVolumes.h"

#include "kddlib/tagfile/StudyPreviews.h"
#include "kddlib/tagfile/StudyTree.h"
#include "kddlib/tagfile/format/VolumeIndex.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"

#include <memory>

namespace Kdd
{

namespace
{

/// The images that one series holds, at their places; null for the others.
QVector<TagMap*> ofSeries(QVector<TagMap*> images, const TagMap* series)
{
    for (TagMap*& image : images) {
        if (image != nullptr && image->parent() != series)
            image = nullptr;
    }
    return images;
}

QVector<TagMap*> withoutGaps(QVector<TagMap*> images)
{
    images.removeAll(nullptr);
    return images;
}

/// The former place of the image that a slice shows.
int imageOfSlice(const Volume& volume, int slice)
{
    return slice < volume.slices().size() ? volume.slices().at(slice).image : slice;
}

}  // namespace

void QAVolumes::giveBack(StudyTree& destination, QASeriesMove& move)
{
    QAVolumes(destination, move).giveBack();
}

QASeriesMove QAVolumes::takeOut(StudyTree& source, TagMap& series)
{
    QASeriesMove move;
    move.source = &source;
    move.seriesUID = series.uid(TagMap::SeriesLevel);
    for (const Volume* volume : series.volumes()) {
        QASeriesMove::Stack stack = {*volume, {}};
        for (int i = 0; i < volume->numImages(); ++i)
            stack.images.append(StudyTree::imageKey(*volume->image(i)));
        // Its slices are to stay as they are while images come and go.
        stack.volume.mImages.set({});
        move.stacks.push_back(stack);
    }
    series.clearVolumes();
    return move;
}

void QAVolumes::giveBack()
{
    // It lost its volumes, so it is numbered anew even if none comes back.
    if (TagMap* series = mMove.source->findSeries(mMove.seriesUID))
        mTouched.append(series);
    for (const QASeriesMove::Stack& stack : mMove.stacks)
        giveBack(stack);
    mMove.stacks.clear();
    for (TagMap* series : qAsConst(mTouched))
        renumber(*series);
}

TagMap* QAVolumes::imageNow(const QByteArray& formerKey) const
{
    if (!mMove.movedTo.contains(formerKey))
        return mMove.source->findImage(formerKey);
    const QByteArray key = mMove.movedTo.value(formerKey);
    // An image that only changed its own UID is still in the source.
    TagMap* image = mDestination.findImage(key);
    return image != nullptr ? image : mMove.source->findImage(key);
}

QVector<TagMap*> QAVolumes::imagesNow(const QASeriesMove::Stack& stack) const
{
    QVector<TagMap*> images;
    images.reserve(stack.images.size());
    for (const QByteArray& key : stack.images)
        images.append(imageNow(key));
    return images;
}

void QAVolumes::giveBack(const QASeriesMove::Stack& stack)
{
    const QVector<TagMap*> images = imagesNow(stack);
    // In the order of the volume's images, so that the same job always numbers the parts alike.
    QVector<TagMap*> holders;
    for (const TagMap* image : images) {
        if (image != nullptr && !holders.contains(image->parent()))
            holders.append(image->parent());
    }
    // One that never had images is only known to exist, in the series that it was found in.
    TagMap* home = mMove.source->findSeries(mMove.seriesUID);
    if (images.isEmpty() && home != nullptr)
        holders.append(home);
    const bool isWhole = holders.size() == 1 && !images.contains(nullptr);
    for (TagMap* series : qAsConst(holders))
        attach(series, stack.volume, ofSeries(images, series), isWhole);
    if (isWhole || !stack.volume.hasPreview())
        return;
    keepPreview(stack.volume, images);
    for (TagMap* series : qAsConst(holders))
        obtainPreview(*series, withoutGaps(ofSeries(images, series)));
}

/// What divides a volume leaves gaps between its slices, so nothing is said about the geometry of a part; nor is the
/// volume file named, which holds all the slices.
void QAVolumes::attach(TagMap* series, const Volume& volume, const QVector<TagMap*>& images, bool isWhole)
{
    auto part = isWhole ? std::make_unique<Volume>(volume) : std::make_unique<Volume>();
    part->attachImages(series->volumes().size(), withoutGaps(images));
    // Attaching sorts the images, so each slice looks for its own.
    QHash<const TagMap*, int> places;
    for (int i = 0; i < part->numImages(); ++i)
        places.insert(part->image(i), i);
    QVector<Slice> slices;
    for (int i = 0; i < volume.slices().size(); ++i) {
        const Slice former = volume.slices().at(i);
        const int place = places.value(images.value(former.image, nullptr), -1);
        // A part has only the slices of its own images; a whole volume keeps those of unknown images, too.
        if (place >= 0 || isWhole)
            slices.append({place, former.frame});
    }
    part->setSlices(slices);
    if (!isWhole)
        part->setGeometry({0, 0, slices.size()}, Box3f(), Mat4f());
    series->addBareVolume(part.release());
    if (!mTouched.contains(series))
        mTouched.append(series);
}

/// Volumes that came together from several series would share their indexes.
void QAVolumes::renumber(TagMap& series)
{
    for (int i = 0; i < series.volumes().size(); ++i)
        series.volumes().at(i)->mVolumeIndex = i;
    nameVolumes(series);
}

/// The preview of a volume that is divided shows the image in its middle; it goes on with that one.
void QAVolumes::keepPreview(const Volume& volume, const QVector<TagMap*>& images)
{
    TagMap* shown = images.value(imageOfSlice(volume, volume.dims().z / 2), nullptr);
    if (shown != nullptr && shown->findElement(kPreview) == nullptr)
        shown->putAndInsertValue(kPreview, VrCode::OB, volume.previewData());
}

void QAVolumes::obtainPreview(TagMap& series, const QVector<TagMap*>& images)
{
    const TagMap& middle = *images.at(images.size() / 2);
    const QByteArray path = filePathOf(middle);
    // A series that shows something already needs no picture of the part.
    if (path.isEmpty() || !series.findPreviewData(nullptr).isEmpty())
        return;
    // Found again by its key: the series may be of the one tree or of the other.
    const QByteArray key = StudyTree::imageKey(middle);
    const StudyTree& holder = mDestination.findImage(key) == &middle ? mDestination : *mMove.source;
    addPreview(holder.findImage(key), path);
}

}  // namespace Kdd
