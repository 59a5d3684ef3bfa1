#pragma once

#include <QByteArray>

namespace Kdd
{

class StudyTree;
class TagMap;

/// Brings fresh images of a study into the tree that holds what was known before, in place of images with the same UID.
class StudyMerge
{
public:
    /// Both must outlive the object, and both are of the same study.
    StudyMerge(StudyTree& tree, StudyTree& fresh)
        : mTree(tree)
        , mFresh(fresh)
    {
    }

    /// Once. The tree then owns what came from the fresh one, which is of no use any more.
    void run();

private:
    void mergeSeries(TagMap* series, const QByteArray& seriesUID, TagMap& freshStudy, TagMap& study);
    void copyImages(const TagMap& from, TagMap& to);

    StudyTree& mTree;
    StudyTree& mFresh;
};

}  // namespace Kdd
