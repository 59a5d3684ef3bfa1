#pragma once

#include "tools/kdd/Commands.h"

namespace Kdd
{

// What several commands are told to work on, and the arguments that tell it.

struct ScanRequest
{
    QList<QByteArray> paths;  ///< files, folders and addresses of objects
    QByteArray from;          ///< a file with a list of such; "-": standard input; empty: none
    bool tolerant = false;    ///< of damaged DICOM files take what is sound
    int jobs = 0;             ///< files read at once; 0: as many as there are cores

    void addTo(ArgumentList& arguments);

    /// The paths, and behind them those of the list. False, with the reason logged and in `outcome`, when there are none
    /// or the list cannot be read.
    bool collect(QList<QByteArray>& all, Outcome& outcome) const;
};

struct StudySelection
{
    QList<QByteArray> studies;
    bool all = false;

    void addTo(ArgumentList& arguments);
};

/// A node of a study: the study, one of its series or one of its images.
struct NodeSelection
{
    QByteArray study;  ///< UID or a unique beginning of it
    QByteArray series;
    QByteArray image;

    void addTo(ArgumentList& arguments);
};

/// The argument of a command that works on one study.
constexpr Argument kOneStudy = {"UID", kStudy, "Study Instance UID, or a unique beginning of it", true};

}  // namespace Kdd
