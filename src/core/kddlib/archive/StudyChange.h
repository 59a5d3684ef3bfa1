#pragma once

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
    Result remove(const ArchiveNode& node);

    /// Applies a correction, trying again for some minutes while others hold the tag files.
    static Result correct(QAData& job);

    /// Brings the tag file into line with the database without opening files: paths, names of volumes, what is not
    /// listed any more. `file` holds the study afterwards. Failure: it cannot be read or written.
    Result synchronise(const QByteArray& studyUID, TagFile& file);

private:
    Result removeRegistered(const ArchiveNode& node);
    Result forget(const ArchiveNode& node);

    Kxg::Catalogue& mCatalogue;
};

}  // namespace Kdd
