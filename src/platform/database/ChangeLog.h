#pragma once

#include "platform/database/StudySearch.h"

namespace Kxg
{

class SqlConnection;

// What happened to studies. Call within a transaction; failures throw DatabaseError.

/// Appends a change. Positions are without gaps and in the order in which changes become visible: one transaction writes
/// at a time, and its turn ends when others see what it wrote.
void noteChange(SqlConnection& connection, const StudyChangeNote& change);

/// At most `limit` changes after a position, in order.
std::vector<StudyChangeNote> changesAfter(SqlConnection& connection, qint64 position, int limit);

}  // namespace Kxg
