#pragma once

#include <kddlib/ArchiveDatabase.h>

#include <memory>

namespace Kdd
{

/// The image database that the command line names, made when it is not there; null, with the reason logged, on failure.
std::unique_ptr<Kxg::Catalogue> openDatabase();

/// The same for commands that work on what an archive has: one that is not there is a failure.
std::unique_ptr<Kxg::Catalogue> openExistingDatabase();

/// The studies that a command works on: those named (UIDs or unique beginnings), or all. False, with each fault
/// logged, when one cannot be found.
bool chooseStudies(Kxg::Catalogue& database, const QList<QByteArray>& named, bool all,
                   QVector<QByteArray>& studyUIDs);

}  // namespace Kdd
