#include "kddlib/tagfile/StudyTree.h"

#include "kddlib/items/FileNaming.h"
#include "kddlib/tagfile/NodeAttributes.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"

#include <algorithm>
#include <vector>

namespace Kdd
{

namespace
{

/// The caller's UIDs may be those of the very nodes that are removed.
std::vector<QByteArray> textsOf(int count, const char** texts)
{
    return count > 0 ? std::vector<QByteArray>(texts, texts + count) : std::vector<QByteArray>();
}

}  // namespace

/// Paths are compared with forward slashes, whatever system they were written on.
QByteArray StudyTree::imageKey(const TagMap& image)
{
    const QByteArray sopUID = image.uid(TagMap::ImageLevel);
    return sopUID.isEmpty() ? forwardSlashes(filePathOf(image)) : sopUID;
}

TagMap* StudyTree::add(TagMap* map, const char* path, bool replace)
{
    std::unique_ptr<TagMap> image(map);
    // The path may be what the image says that is about to be replaced.
    const QByteArray givenPath(path);
    const QByteArray studyUID = image->uid(TagMap::StudyLevel);
    const QByteArray seriesUID = image->uid(TagMap::SeriesLevel);
    QByteArray key = imageKey(*image);
    const bool isKnownByPath = key.isEmpty() && path != nullptr;
    if (isKnownByPath)
        key = forwardSlashes(givenPath);
    // Without any name it could not be found again, and an image of another study has no place here.
    if (key.isEmpty() || (!mStudies.isEmpty() && mStudies.firstKey() != studyUID))
        return nullptr;
    if (TagMap* old = mImages.find(key)) {
        // Placed once already: to take it out and put it back would lose what it inherits.
        if (old == map)
            return image.release();
        if (!replace)
            return nullptr;
        replaceImage(old, *image, seriesUID);
    }
    // What another series and study said of themselves is not the image's to bring along.
    dropOfTheNode(*image);
    mImages.insert(key, image.get());
    mAdded.append(key);
    placeInSeries(image.get(), seriesUID, studyUID);
    if (path != nullptr)
        image->putAndInsertValue(kFileSuffix, VrCode::LO, extractSuffix(givenPath.constData()));
    if (isKnownByPath)
        image->putAndInsertValue(kFilePath, VrCode::LO, givenPath);
    return image.release();
}

/// In its series the new image takes the old one's places in the volumes, which know their images by UID.
void StudyTree::replaceImage(TagMap* old, TagMap& image, const QByteArray& seriesUID)
{
    TagMap* series = old->parent();
    const bool staysInSeries = series != nullptr && series == findSeries(seriesUID);
    if (staysInSeries)
        image.takeVolumePlaces(*old);
    delete old;
    // One that the new image comes into is about to have a child again.
    if (series != nullptr && series->children().isEmpty() && !staysInSeries)
        dropSeries(series);
}

void StudyTree::placeInSeries(TagMap* image, const QByteArray& seriesUID, const QByteArray& studyUID)
{
    if (TagMap* series = mSeries.value(seriesUID, nullptr)) {
        attachBelow(*series, image, TagMap::ImageLevel);
        return;
    }
    auto* series = new TagMap;
    mSeries.insert(seriesUID, series);
    // The image first: a new series takes what it is to share from its image, and the study takes it from there.
    attachBelow(*series, image, TagMap::ImageLevel);
    std::shared_ptr<TagMap>& study = mStudies[studyUID];
    if (study == nullptr)
        study = std::make_shared<TagMap>();
    holdInSeries(*study);
    attachBelow(*study, series, TagMap::SeriesLevel);
}

TagMap* StudyTree::findImage(const QByteArray& key) const
{
    TagMap* image = mImages.find(key);
    // The path of an image without UID, as it was given.
    return image != nullptr || !key.contains('\\') ? image : mImages.find(forwardSlashes(key));
}

TagMap* StudyTree::findImage(const QByteArray& key, const QByteArray& suffix) const
{
    TagMap* image = findImage(key);
    if (image == nullptr || suffix.isEmpty())
        return image;
    const TagElement* held = image->findElement(kFileSuffix);
    // An image whose suffix is not known is not refused: there is no other of its UID.
    return held == nullptr || held->value() == suffix ? image : nullptr;
}

TagMap* StudyTree::takeImage(const QByteArray& key)
{
    TagMap* image = findImage(key);
    if (image == nullptr)
        return nullptr;
    // The copy first: what the image inherits it loses with its place.
    TagMap* copy = image->clone();
    mImages.remove(image, key);
    delete image;
    return copy;
}

int StudyTree::removeImages(int count, const char** keys)
{
    int removed = 0;
    for (const QByteArray& key : textsOf(count, keys)) {
        TagMap* image = findImage(key);
        TagMap* series = image != nullptr ? image->parent() : nullptr;
        if (series == nullptr)
            continue;
        mImages.remove(image, key);
        delete image;
        ++removed;
        if (series->children().isEmpty() && series->parent() != nullptr)
            dropSeriesAndEmptyStudy(series);
    }
    return removed;
}

int StudyTree::removeSeries(int count, const char** seriesUIDs)
{
    int removed = 0;
    for (const QByteArray& seriesUID : textsOf(count, seriesUIDs)) {
        TagMap* series = findSeries(seriesUID);
        if (series == nullptr)
            continue;
        dropSeriesAndEmptyStudy(series);
        ++removed;
    }
    return removed;
}

void StudyTree::removeImagesWithoutFilename(const TagMap& series)
{
    // From the end, because each that goes leaves the list of children.
    for (int i = series.children().size() - 1; i >= 0; --i) {
        TagMap* image = series.children().at(i);
        if (!image->tagsForLevel().contains(kFilePath))
            dropImage(image);
    }
}

void StudyTree::dropImage(TagMap* image)
{
    mImages.remove(image, imageKey(*image));
    delete image;
}

void StudyTree::dropSeriesAndEmptyStudy(TagMap* series)
{
    for (TagMap* image : series->children())
        mImages.remove(image, imageKey(*image));
    // Asked before the series goes and takes the answer along.
    TagMap* study = series->parent();
    dropSeries(series);
    if (study != nullptr)
        dropStudyIfEmpty(study);
}

/// A node that is deleted takes itself out of its parent. What it says of its UID may have changed since it was indexed.
void StudyTree::dropSeries(TagMap* series)
{
    const QByteArray uid = series->uid(TagMap::SeriesLevel);
    mSeries.remove(mSeries.value(uid, nullptr) == series ? uid : mSeries.key(series));
    delete series;
}

void StudyTree::dropStudyIfEmpty(TagMap* study)
{
    if (!study->children().isEmpty())
        return;
    const auto holds = [study](const std::shared_ptr<TagMap>& each) { return each.get() == study; };
    // By the node: what the study says of its UID may have been corrected since it was entered.
    const auto at = std::find_if(mStudies.begin(), mStudies.end(), holds);
    if (at != mStudies.end())
        mStudies.erase(at);
}

void StudyTree::deleteEmptyNodes()
{
    for (auto it = mSeries.begin(); it != mSeries.end();) {
        if (it.value()->children().isEmpty()) {
            delete it.value();
            it = mSeries.erase(it);
        } else {
            ++it;
        }
    }
    for (auto it = mStudies.begin(); it != mStudies.end();) {
        if (it.value()->children().isEmpty())
            it = mStudies.erase(it);
        else
            ++it;
    }
}

void StudyTree::optimize()
{
    // Series first: what the images of each share must stand there before the study can see what all series share.
    for (TagMap* series : qAsConst(mSeries))
        series->optimizeAll();
    for (const std::shared_ptr<TagMap>& study : qAsConst(mStudies))
        study->optimizeAll();
    deleteEmptyNodes();
}

void StudyTree::clear()
{
    mSeries.clear();
    mImages = {};
    mAdded.clear();
    mStudies.clear();
}

QByteArray StudyTree::studyInstanceUID() const
{
    return mStudies.isEmpty() ? QByteArray() : mStudies.firstKey();
}

std::shared_ptr<TagMap> StudyTree::study() const
{
    return mStudies.isEmpty() ? nullptr : mStudies.first();
}

}  // namespace Kdd
