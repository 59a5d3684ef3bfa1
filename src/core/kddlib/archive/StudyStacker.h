#pragma once

#include "kddlib/volumes/StackPlanner.h"
#include "platform/base/Export.h"
#include "platform/database/Catalogue.h"

#include <QList>
#include <QMap>
#include <QString>
#include <QStringList>

namespace Kdd
{

class TagMap;

/// What is told of one series.
struct StackedSeries
{
    QByteArray uid;
    QStringList volumes;         ///< "512 x 512 x 100 at 2.5 mm"
    QMap<QString, int> reasons;  ///< why images are in none, and how many
    bool hadVolumes = false;
};

/// How studies are stacked.
struct StackOptions
{
    QString
        folder;  ///< of all volume files; those of a study lie in folders below, as the tag files do in theirs
    bool again = false;  ///< also series that have volume files already
    FrameOfReference reference = FrameOfReference::Shared;
};

/// Makes volume files from the series of a study that can be stacked, registers them and completes the study. Used by
/// the thread of its catalogue.
class KDD_EXPORT StudyStacker
{
public:
    /// The catalogue must outlive the object.
    StudyStacker(Kxg::Catalogue& catalogue, StackOptions options);

    /// False when anything failed, each of which is logged. Volumes that were made are registered nevertheless.
    bool stack(const QByteArray& studyUID);

    /// Of the study stacked last.
    const QList<StackedSeries>& series() const { return mSeries; }

private:
    bool run();
    void removeUnfinished() const;
    bool stackSeries(const QByteArray& seriesUID, const TagMap& series);
    bool clearSeries(const QByteArray& seriesUID, const TagMap& series, bool& isStacked);
    Result writeVolume(const QByteArray& seriesUID, const Stack& stack, int index);
    QByteArray volumePath(const QByteArray& seriesUID, int index) const;

    Kxg::Catalogue& mCatalogue;
    const StackOptions mOptions;
    QByteArray mStudyUID;
    QString mFolder;             // of the study
    QVector<QByteArray> mKnown;  // volume files of the study
    Kxg::FileRecords mMade;
    bool mIsChanged = false;
    QList<StackedSeries> mSeries;
};

}  // namespace Kdd
