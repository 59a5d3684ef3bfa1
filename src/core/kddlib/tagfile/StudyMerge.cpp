#include "kddlib/tagfile/StudyMerge.h"

#include "kddlib/tagfile/NodeAttributes.h"
#include "kddlib/tagfile/SeriesLabels.h"
#include "kddlib/tagfile/StudyTree.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"

namespace Kdd
{

namespace
{

/// The mark was made by whoever built the file from the database, which knows more than the images tell.
void keepVolumeFileMark(const TagMap& from, TagMap& to)
{
    const TagElement* mark = from.findElement(kHasVolumeFile);
    if (mark != nullptr && to.findElement(kHasVolumeFile) == nullptr)
        to.putElement(kHasVolumeFile, mark->clone());
}

}  // namespace

void StudyMerge::run()
{
    TagMap& study = *mTree.study();
    TagMap& freshStudy = *mFresh.study();
    const bool areLabelled = hasLabels(mFresh) || hasLabels(mTree);
    // What a study says of all its series would be inherited by series that come from the other one.
    holdInSeries(freshStudy);
    holdInSeries(study);
    for (auto it = mFresh.series().cbegin(); it != mFresh.series().cend(); ++it)
        mergeSeries(it.value(), it.key(), freshStudy, study);
    // A series may have lost all its images to fresh ones that stand in another series.
    mTree.deleteEmptyNodes();
    // Labels are distinct among the series of a study, so fresh ones are made for all.
    if (areLabelled)
        createLabels(mTree);
    // Only what was joined has values to be placed anew; the others are as the file had them.
    for (auto it = mFresh.series().cbegin(); it != mFresh.series().cend(); ++it) {
        if (TagMap* series = mTree.findSeries(it.key()))
            series->optimizeAll();
    }
    study.optimizeAll();
}

/// Joins a fresh series with the one of the same UID that the file holds. The series that has volumes stays, the fresh
/// one if both have: its volumes were made from all that is known now. Without volumes the fewer images are copied into
/// the series of the more: a few images that arrive for a series of thousands cost little more than reading and writing
/// the file.
void StudyMerge::mergeSeries(TagMap* series, const QByteArray& seriesUID, TagMap& freshStudy, TagMap& study)
{
    TagMap* old = mTree.findSeries(seriesUID);
    for (TagMap* image : series->children()) {
        TagMap* former = mTree.forgetImage(StudyTree::imageKey(*image));
        if (former != nullptr && former->parent() == old && series->volumes().isEmpty())
            // Only where the old volumes stay: a fresh series with volumes of its own has placed its images
            // already, and an image that comes from another series leaves its volumes behind.
            image->takeVolumePlaces(*former);
        delete former;
    }
    if (old != nullptr && series->volumes().isEmpty() &&
        (!old->volumes().isEmpty() || old->children().size() > series->children().size())) {
        copyImages(*series, *old);
        return;
    }
    for (TagMap* image : series->children())
        mTree.enterImage(StudyTree::imageKey(*image), image);
    if (old != nullptr) {
        // What the fresh series does not bring is taken over from the old one before that goes.
        copyImages(*old, *series);
        keepVolumeFileMark(*old, *series);
        delete old;
    }
    mTree.enterSeries(seriesUID, series);
    // The series leaves its study: what it inherits has to be its own
    // before, and its items have to stand alone.
    series->copyFromParent();
    series->deleteElement(kFromDatabase);
    series->detachItems();
    freshStudy.removeChildMap(series);
    attachBelow(study, series, TagMap::SeriesLevel);
}

/// What an image says of the volumes of its old series would name others in the new one. It only comes along into the
/// places of the image that it replaces.
void StudyMerge::copyImages(const TagMap& from, TagMap& to)
{
    for (TagMap* image : from.children()) {
        TagMap* copy = image->clone();
        copy->deleteElement(kVolumeIndex);
        dropOfTheNode(*copy);
        copy->takeVolumePlaces(*image);
        mTree.enterImage(StudyTree::imageKey(*copy), copy);
        attachBelow(to, copy, TagMap::ImageLevel);
    }
}

}  // namespace Kdd
