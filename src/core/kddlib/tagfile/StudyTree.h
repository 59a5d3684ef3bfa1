#pragma once

#include <QByteArray>
#include <QHash>
#include <QMap>
#include <QVector>

#include <memory>

namespace Kdd
{

class TagMap;

/// One study as a tree of study, series and images, with indexes by UID.
///
/// The tree owns the study, the study its series, a series its images. The indexes only point into it. An image without
/// SOP Instance UID, of which a few kinds of DICOM objects exist, is known by its file path instead.
///
/// It knows nothing of files: who reads, merges or corrects one works on the tree. One tree is used by one thread at a
/// time.
class StudyTree
{
public:
    using Studies = QMap<QByteArray, std::shared_ptr<TagMap>>;
    using Nodes = QMap<QByteArray, TagMap*>;

    StudyTree() = default;
    ~StudyTree() = default;
    StudyTree(StudyTree&&) noexcept = default;
    StudyTree& operator=(StudyTree&&) noexcept = default;
    StudyTree(const StudyTree&) = delete;
    StudyTree& operator=(const StudyTree&) = delete;

    /// The name under which an image is known: its SOP Instance UID, and where it has none its file path.
    static QByteArray imageKey(const TagMap& image);

    // ---- looking

    bool isEmpty() const { return mStudies.isEmpty(); }

    /// Of the study held; empty when there is none.
    QByteArray studyInstanceUID() const;
    std::shared_ptr<TagMap> study() const;

    const Studies& studies() const { return mStudies; }
    const Nodes& series() const { return mSeries; }
    const Nodes& images() const { return mImages.inOrder(); }

    /// Owned by the tree; null when absent.
    TagMap* findSeries(const QByteArray& seriesUID) const { return mSeries.value(seriesUID, nullptr); }
    TagMap* findImage(const QByteArray& key) const;

    /// Only the image that the index has under exactly this key, however paths may be written.
    TagMap* imageUnder(const QByteArray& key) const { return mImages.find(key); }

    /// Null also when the image has another file name suffix; an empty suffix matches any.
    TagMap* findImage(const QByteArray& key, const QByteArray& suffix) const;

    // ---- placing

    /// Places an image and takes it over. Null, and the map is deleted, when it belongs to another study than the one
    /// held, when the image is there already and `replace` is false, or when it has neither SOP Instance UID nor path.
    /// `path` may be null; it gives the image's file name suffix. A map that the tree holds already stays.
    TagMap* add(TagMap* map, const char* path, bool replace);

    /// The keys of all images that were added, in their order; also of those that have been replaced or removed since.
    const QVector<QByteArray>& added() const { return mAdded; }

    /// For who makes the nodes himself, as readers do: each enters a node that hangs in its place already. What the
    /// index had under that name before is only forgotten.
    void enterStudy(const QByteArray& uid, const std::shared_ptr<TagMap>& study)
    {
        mStudies.insert(uid, study);
    }
    void enterSeries(const QByteArray& uid, TagMap* series) { mSeries.insert(uid, series); }
    void enterImage(const QByteArray& key, TagMap* image) { mImages.insert(key, image); }

    /// The image, which hangs where it was, but is known by its name no more; null when absent.
    TagMap* forgetImage(const QByteArray& key) { return mImages.take(key); }

    // ---- removing

    /// Takes the image out and gives a copy of all it showed, which the caller owns; null when absent. The series
    /// stays, even without images.
    TagMap* takeImage(const QByteArray& key);

    /// Remove what is found of `count` UIDs, series and studies that become empty too; the number removed.
    int removeImages(int count, const char** keys);
    int removeSeries(int count, const char** seriesUIDs);

    /// Deletes an image of this tree; its series stays.
    void dropImage(TagMap* image);

    /// Deletes a series of this tree, whose images are known no more, and its study if that becomes empty.
    void dropSeriesAndEmptyStudy(TagMap* series);

    /// Removes the images of a series that have no file path (0006,7100) of their own.
    void removeImagesWithoutFilename(const TagMap& series);

    void deleteEmptyNodes();
    void clear();

    /// Places every attribute where it costs the fewest bytes.
    void optimize();

private:
    /// Images in the order of their UIDs for whoever walks through all of them, and hashed for requests: among UIDs
    /// that differ in their last digits only, the search in order is the largest part of a request.
    class ImageIndex
    {
    public:
        TagMap* find(const QByteArray& key) const { return mHashed.value(key, nullptr); }
        const Nodes& inOrder() const { return mInOrder; }

        void insert(const QByteArray& key, TagMap* image)
        {
            // Readers mostly bring them in order.
            if (mInOrder.isEmpty() || mInOrder.lastKey() < key)
                mInOrder.insert(mInOrder.cend(), key, image);
            else
                mInOrder.insert(key, image);
            mHashed.insert(key, image);
        }

        TagMap* take(const QByteArray& key)
        {
            mHashed.remove(key);
            return mInOrder.take(key);
        }

        /// Lets go of an image, by its key if it still stands under that: what the key was made from may have changed.
        void remove(TagMap* image, const QByteArray& key)
        {
            take(find(key) == image ? key : mInOrder.key(image));
        }

    private:
        Nodes mInOrder;
        QHash<QByteArray, TagMap*> mHashed;
    };

    void replaceImage(TagMap* old, TagMap& image, const QByteArray& seriesUID);
    void placeInSeries(TagMap* image, const QByteArray& seriesUID, const QByteArray& studyUID);
    void dropSeries(TagMap* series);
    void dropStudyIfEmpty(TagMap* study);

    Studies mStudies;
    Nodes mSeries;
    ImageIndex mImages;
    QVector<QByteArray> mAdded;
};

}  // namespace Kdd
