#pragma once

#include "tools/kdd/Commands.h"

#include <QByteArray>
#include <QList>

#include <kddlib/Catalogue.h>
#include <kddlib/TagFile.h>

namespace Kdd
{

/// Finds the study whose UID is `text` or, if that names none, begins with it. On failure (none, or several) the
/// reason is logged. The database is asked only when `text` is not the UID of a tag file.
bool resolveStudy(const QByteArray& text, QByteArray& studyUID);
bool resolveStudy(Kxg::Catalogue& database, const QByteArray& text, QByteArray& studyUID);

/// Reads the study that `text` names; failures are logged.
bool readStudy(const QByteArray& text, TagFile& file);

/// The study's tag file; one that holds another study is refused. Failures are logged.
bool readStudyFile(const QByteArray& studyUID, TagFile& file);

/// The same for a tag file that is named by its path, whatever study it holds.
bool readTagFile(const QString& path, TagFile& file);

/// How long a file is, whatever bytes its name is of; 0 when there is none [bytes].
qint64 sizeOf(const QString& path);

/// Where the files of objects are that arrive over a network.
QByteArray objectFolder(const GlobalOptions& options);

/// What the archive keeps itself and must not take in: tag files, volume files, the database.
QList<QByteArray> ownPlaces(const GlobalOptions& options);

}  // namespace Kdd
