#pragma once

#include "server/dicomweb/Verdict.h"

namespace Kdd::DicomWeb
{

/// What became of a study that was looked up.
enum class Presence {
    Found,
    Absent,   ///< there is no tag file, and no image is registered
    Unbuilt,  ///< there is no tag file yet, though images are registered
    Held,     ///< others hold it longer than the site's patience; asking again makes sense
    Damaged,  ///< told in the log
    Missing,  ///< there is no tag file, though there was one and images are registered; told in the log
};

/// What those are told who asked for something of the study.
Verdict verdictOn(Presence presence);

}  // namespace Kdd::DicomWeb
