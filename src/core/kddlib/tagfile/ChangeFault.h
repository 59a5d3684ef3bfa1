#pragma once

namespace Kdd
{

/// Why a change of stored images failed, and with that what there is now and what is to be done about it.
enum class ChangeFault {
    None,
    Absent,     ///< there is nothing of that name
    Refused,    ///< because of what it asks of these images: it would be refused again
    LockedOut,  ///< others hold a study all the time, and nothing is changed: try again
    Unasked,    ///< the image database failed, and nothing is changed: try again
    Kept,       ///< it is kept and not all shown yet: whoever builds or opens the study next completes it
    Failed,     ///< nothing is changed; of a move that no database knows of, images may stand in both studies
};

}  // namespace Kdd
