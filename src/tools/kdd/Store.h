#pragma once

#include "kddlib/tagfile/TagFile.h"
#include "platform/database/Catalogue.h"

#include <QByteArray>
#include <QStringList>

namespace Kdd
{

/// Paths of all tag files below the meta folder, sorted.
QStringList storedTagFiles();

/// Finds the study whose UID is `text` or, if that names none, begins with it. On failure (none, or several) the
/// reason is logged. The database is asked only when `text` is not the UID of a tag file.
bool resolveStudy(const QByteArray& text, QByteArray& studyUID);
bool resolveStudy(Kxg::Catalogue& database, const QByteArray& text, QByteArray& studyUID);

/// Reads the study that `text` names; failures are logged.
bool readStudy(const QByteArray& text, TagFile& file);

/// The last error of reading a file is told here when the library itself has not logged it, as for an absent file.
bool readStudyFile(const QString& path, TagFile& file);

}  // namespace Kdd
