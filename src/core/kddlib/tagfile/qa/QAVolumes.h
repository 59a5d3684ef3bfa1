#pragma once

#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagfile/qa/QASeriesMove.h"

namespace Kdd
{

/// Takes the volumes of a series apart by the series that hold its images now. Used by one thread, while both tag files
/// are held.
class TagFile::QAVolumes
{
public:
    /// Takes the volumes out of a series, before the first of its images is touched.
    static QASeriesMove takeOut(TagFile& source, TagMap& series);

    QAVolumes(TagFile& destination, QASeriesMove& move)
        : mDestination(destination)
        , mMove(move)
    {
    }

    void giveBack();

private:
    TagMap* imageNow(const QByteArray& formerKey) const;
    QVector<TagMap*> imagesNow(const QASeriesMove::Stack& stack) const;
    void giveBack(const QASeriesMove::Stack& stack);
    void attach(TagMap* series, const Volume& volume, const QVector<TagMap*>& images, bool isWhole);
    static void renumber(TagMap& series);
    static void keepPreview(const Volume& volume, const QVector<TagMap*>& images);
    void obtainPreview(TagMap& series, const QVector<TagMap*>& images);

    TagFile& mDestination;
    QASeriesMove& mMove;
    QVector<TagMap*> mTouched;  // series whose volumes have changed
};

}  // namespace Kdd
