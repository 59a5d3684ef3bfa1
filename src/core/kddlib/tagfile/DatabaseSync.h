#pragma once

#include "platform/base/Result.h"

#include <QByteArray>

#include <memory>

namespace Kxg
{
struct DicomDirectoryEntry;
}  // namespace Kxg

namespace Kdd
{

class StoredStudy;
class StudyTree;

/// Brings a tree into line with what the database says of its study: file paths, volume names, images that are gone,
/// series that are gone or new. An image that a correction moved here or renamed stays. Another study's entry is refused. Whether anything changed.
bool syncWithDatabase(StudyTree& tree, const std::shared_ptr<Kxg::DicomDirectoryEntry>& study);

/// Reads the study's tag file and brings it into line with the image database, in memory only. False when the database
/// does not know the study or cannot be asked, or when the file cannot be read, which all is logged. `read` is what came
/// of the reading, as it was when it did not come to that.
bool readAndSync(StoredStudy& held, const QByteArray& studyUID, Result& read);

}  // namespace Kdd
