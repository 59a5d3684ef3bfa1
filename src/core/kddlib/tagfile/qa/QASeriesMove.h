#pragma once

#include "kddlib/volumes/Volume.h"

#include <QByteArray>
#include <QHash>
#include <QVector>

#include <vector>

namespace Kdd
{

class StudyTree;

/// A series whose images are corrected, with its volumes as they were before. The volumes know their images by UID,
/// for the images themselves may be replaced.
struct QASeriesMove
{
    struct Stack
    {
        Volume volume;  ///< without its images
        QVector<QByteArray> images;
    };

    StudyTree* source = nullptr;  ///< which holds the series; not owned
    QByteArray seriesUID;
    std::vector<Stack> stacks;

    /// For each image that was moved the UID under which it is held now. Others that the series does not hold any more
    /// are gone.
    QHash<QByteArray, QByteArray> movedTo;
};

}  // namespace Kdd
