#pragma once

#include "platform/base/Result.h"

#include <QByteArray>
#include <QList>

#include <vector>

namespace Kxg
{

/// The file that counts of an image, whichever study it is in.
struct HeldFile
{
    QByteArray sopInstanceUID;  ///< as the file has it
    QByteArray path;
    qint64 size = 0;  ///< when it was registered [bytes]
    QByteArray shownStudyUID;
    QByteArray shownImage;
};

/// Asks the database of this process for images by the SOP Instance UIDs that their files have themselves, wherever
/// corrections have put the images and whatever these are called now. On any thread, which has a connection of its own.
Kdd::Result heldFiles(const QList<QByteArray>& sopUIDs, std::vector<HeldFile>& files);

}  // namespace Kxg
