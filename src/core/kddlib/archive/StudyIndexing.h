#pragma once

#include "platform/base/Export.h"
#include "platform/base/Result.h"
#include "platform/database/StudySearch.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctagkey.h>

#include <vector>

namespace Kdd
{

class TagFile;
class TagMap;
class WorkObserver;

/// Keeps what searches know of studies in line with their tag files. Whoever writes a tag file under the study's claim
/// tells the database of it at once; this is for files that came about in another way: restored from a backup, written
/// before searches were known, left by a process that died. Used by the thread of its search.
class KDD_EXPORT StudyIndexing
{
public:
    /// The search must outlive the object.
    explicit StudyIndexing(Kxg::StudySearch& search)
        : mSearch(search)
    {
    }

    /// Whether the study's tag file is still the one that was found. So it is when there is none any more: what it showed
    /// is all that is known.
    static bool isCurrent(const Kxg::FoundStudy& study);

    /// Whether answers of studies, or of series, have the attribute from the database.
    static bool isStudyAttribute(const DcmTagKey& key);
    static bool isSeriesAttribute(const DcmTagKey& key);

    /// What an image says to limits by itself.
    enum class Standing {
        Within,
        Silent,  ///< it has not all that they ask for, but no other value either
        Beyond,
    };

    static Standing standingOf(const TagMap& image, const Kxg::StudyLimits& limits);

    /// Reads the tag files of those studies that are not and takes over what they show. How many studies differ now; a
    /// tag file that cannot be read is told in the log and leaves what was known.
    int refresh(const std::vector<const Kxg::FoundStudy*>& studies);

    /// What was done for all studies.
    struct Totals
    {
        int studies = 0;
        int failed = 0;
    };

    /// Makes searches know every study that has a tag file and is not known to them yet. A repeat goes on where an
    /// earlier run ended. False, with the reason logged, when the database cannot be asked.
    bool fill(WorkObserver& observer, Totals& totals);

private:
    Result take(const Kxg::FoundStudy& study, bool& isDone);

    Kxg::StudySearch& mSearch;
};

}  // namespace Kdd
