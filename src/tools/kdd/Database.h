#pragma once

#include "platform/database/Catalogue.h"

#include <memory>

namespace Kdd
{

/// The image database that the command line names, opened for this thread; null, with the reason logged, on failure.
std::unique_ptr<Kxg::Catalogue> openDatabase();

/// Logs a failure; whether the result is good.
bool succeeded(const Result& result);

/// The studies that a command works on: those named (UIDs or unique beginnings), or all. False, with each fault
/// logged, when one cannot be found.
bool chooseStudies(Kxg::Catalogue& database, const QList<QByteArray>& named, bool all,
                   QVector<QByteArray>& studyUIDs);

}  // namespace Kdd
