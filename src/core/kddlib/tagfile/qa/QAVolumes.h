#pragma once

#include "kddlib/tagfile/qa/QASeriesMove.h"

#include <QSet>
#include <QVector>

namespace Kdd
{

class TagMap;
struct VolumeInfo;

/// Keeps the volumes of series whose images a correction moves: takes them out before, and gives each part back to the
/// series that holds its images then. Used by one thread, while the files of both trees are held.
class QAVolumes
{
public:
    /// Takes the volumes out of a series, before the first of its images is touched.
    static QASeriesMove takeOut(StudyTree& source, TagMap& series);

    /// Gives back what was taken out: each part of a volume to the series that now holds its images. A volume that
    /// stays whole keeps all it says; one that is divided has only its images and slices in common with the volume file,
    /// so its parts are bare.
    static void giveBack(StudyTree& destination, QASeriesMove& move);

    /// Adds what is left of a volume whose images a correction has divided, named in `info` as they are known here: to
    /// each series that holds some of them a bare volume of these. Those that are not held stand elsewhere.
    static void addDivided(StudyTree& tree, const VolumeInfo& info);

    /// Gives the images of a tree the volumes that another state of the same study has of volume files with these
    /// suffixes, and what was divided of them. `former` has none any more then.
    static void keep(StudyTree& tree, StudyTree& former, const QSet<QByteArray>& suffixes);

private:
    QAVolumes(StudyTree& destination, QASeriesMove& move)
        : mDestination(destination)
        , mMove(move)
    {
    }

    void giveBack();
    TagMap* imageNow(const QByteArray& formerKey) const;
    QVector<TagMap*> imagesNow(const QASeriesMove::Stack& stack) const;
    void giveBack(const QASeriesMove::Stack& stack);
    void attach(TagMap* series, const Volume& volume, const QVector<TagMap*>& images, bool isWhole);
    static void renumber(TagMap& series);
    static void keepPreview(const Volume& volume, const QVector<TagMap*>& images);
    void obtainPreview(TagMap& series, const QVector<TagMap*>& images);

    StudyTree& mDestination;
    QASeriesMove& mMove;
    QVector<TagMap*> mTouched;  // series whose volumes have changed
};

}  // namespace Kdd
