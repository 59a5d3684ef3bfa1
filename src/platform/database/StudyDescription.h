#pragma once

#include "platform/database/Catalogue.h"

namespace Kxg
{

class SqlConnection;

// What the lists tell of studies and series, taken from an image of theirs. Call within a transaction; failures throw
// DatabaseError.

void describeStudy(SqlConnection& connection, qint64 studyId, const DicomFileRecord& image);
void describeSeries(SqlConnection& connection, qint64 seriesId, const DicomFileRecord& image);

}  // namespace Kxg
