#pragma once

#include "platform/base/Export.h"
#include "platform/base/Result.h"
#include "platform/database/DirectoryEntry.h"

#include <QByteArray>
#include <QMap>

#include <memory>
#include <string>
#include <vector>

/// What tag files ask of the image database. Every function may be called on any thread: each thread has a connection
/// of its own, opened on its first question. Lists come in an order that depends on what is registered and not on when
/// or by which engine.
namespace Kxg
{

struct ImageCorrection;

// NOLINTBEGIN(readability-identifier-naming): named as the database's questions are.

/// The database that all questions go to: "sqlite:FILE", "postgresql://[USER[:PASSWORD]@]HOST[:PORT]/DATABASE" or
/// "postgresql:///DATABASE?host=FOLDER" for a server's local socket. Set once at start.
KDD_EXPORT void SetDatabaseServer(const QByteArray& address);
KDD_EXPORT QByteArray DatabaseServer();

/// The files of one study: DICOM files by path, volume files by part number and path, and the UIDs of the series that
/// have a volume file. `user` is noted in the server's log of the connection and grants nothing. A study that does not
/// exist is a failure.
KDD_EXPORT Kdd::Result GetAllFilesOfStudy(const QByteArray& user, int studyId,
                                          std::vector<std::string>& dicomFiles,
                                          std::vector<std::string>& volumeFiles,
                                          std::vector<std::string>& seriesUIDs);

/// What corrections have to do with a study, the one of that UID: those of images that are or were in it, and the volume
/// files listed for it that belong to other studies, because corrections brought images of them here. Nothing of a study
/// that does not exist.
KDD_EXPORT Kdd::Result GetCorrections(int studyId, QByteArray& studyUID,
                                      std::vector<ImageCorrection>& corrections,
                                      std::vector<std::string>& foreignVolumes);

/// A study with all its series and their volume files; null in `study` when there is none of that UID.
KDD_EXPORT Kdd::Result GetStudy(const QByteArray& studyUID, std::shared_ptr<DicomDirectoryEntry>& study);

/// The images of every series of a study, by Series Instance UID.
KDD_EXPORT Kdd::Result GetSeries(const QByteArray& studyUID,
                                 QMap<QByteArray, std::shared_ptr<SeriesInfo>>& series);

/// Whether a file was registered as damaged (`DicomFileRecord::isDamaged`) and has not changed since. False when it
/// does not exist or the database cannot be asked.
KDD_EXPORT bool IsDamagedFile(const char* path);

/// A configuration value, or `fallback` when it is not set or cannot be asked for.
KDD_EXPORT QByteArray GetGlobalConfig(const QByteArray& section, const QByteArray& key,
                                      const QByteArray& fallback);

// NOLINTEND(readability-identifier-naming)

}  // namespace Kxg
