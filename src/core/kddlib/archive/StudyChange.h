#pragma once

#include "kddlib/tagfile/ChangeFault.h"
#include "platform/base/Export.h"
#include "platform/base/Result.h"
#include "platform/database/Catalogue.h"

#include <QByteArray>

namespace Kdd
{

class TagFile;
struct QAData;

/// A study, or one of its series or images.
struct ArchiveNode
{
    QByteArray study;   ///< Study Instance UID
    QByteArray series;  ///< Series Instance UID, or empty
    QByteArray image;   ///< SOP Instance UID, the path of an image without one, or empty
};

/// What became of a removal.
struct Removal
{
    ChangeFault fault = ChangeFault::None;
    Result result;
    int images = 0;  ///< that are gone
};

/// Changes of what the archive holds: removals, corrections, bringing a tag file into line with the database. Each waits
/// for whoever works on the study, and goes through to its end under one claim. Used by the thread of its catalogue.
class KDD_EXPORT StudyChange
{
public:
    /// The catalogue must outlive the object.
    explicit StudyChange(Kxg::Catalogue& catalogue)
        : mCatalogue(catalogue)
    {
    }

    /// Removes a node for good; its files stay where they are, and come back only when they are taken in again. The
    /// catalogue forgets it first, so that a process that dies in between leaves a study that waits to be completed, and
    /// a repeat completes it. Failure: there is no such node, or it is not removed.
    Result remove(const ArchiveNode& node) { return remove(node, kRemovalPatience).result; }

    /// The same for whoever waits only so long [ms] for others that work on the study.
    Removal remove(const ArchiveNode& node, int patienceMs);

    /// Applies a correction, trying again for so long [ms] while others work on the studies or hold the tag files.
    static Result correct(QAData& job, int patienceMs = kCorrectionPatience);

    /// Tells in the job's outcome what correcting would do now, and fails as that would. Nothing is changed.
    static Result preview(QAData& job, int patienceMs = kCorrectionPatience);

    /// Brings the tag file into line with the database without opening files: paths, names of volumes, what is not
    /// listed any more. `file` holds the study afterwards. Failure: it cannot be read or written.
    Result synchronise(const QByteArray& studyUID, TagFile& file);

private:
    // The largest studies take some minutes to be built [ms].
    static constexpr int kRemovalPatience = 10 * 60 * 1000;
    static constexpr int kCorrectionPatience = 2 * 60 * 1000;

    Removal removeRegistered(const ArchiveNode& node, int patienceMs);
    Result forget(const ArchiveNode& node);

    Kxg::Catalogue& mCatalogue;
};

}  // namespace Kdd
