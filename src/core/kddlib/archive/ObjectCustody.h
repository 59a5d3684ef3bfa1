#pragma once

#include "platform/base/Export.h"

#include <QByteArray>

#include <vector>

namespace Kdd
{

/// What there is to say to somebody who wants to leave an object to the archive alone.
enum class Custody {
    Kept,        ///< it is on the disk, registered, and will survive a power cut
    Unknown,     ///< there is no such object, or none any more
    OtherClass,  ///< the object of this UID is of another class
    Failed,      ///< it cannot be told now, or the object's file is damaged
};

/// An object as somebody names it who has sent it: by what its dataset says.
struct ObjectReference
{
    QByteArray sopClassUID;
    QByteArray sopInstanceUID;
    Custody custody = Custody::Unknown;

    // Of one that there is: where it is shown, which a correction may have changed.

    QByteArray studyUID;
    QByteArray image;
};

/// Looks after objects: each has to be registered, its file whole and of that class, and on the disk, for which it is waited
/// here where nobody did so before. An object that was sent and corrected since is kept: its file is. May be called on any
/// thread, which has a connection to the database of its own. What cannot be looked up is told as failed and logged.
KDD_EXPORT void takeCustody(std::vector<ObjectReference>& objects);

}  // namespace Kdd
