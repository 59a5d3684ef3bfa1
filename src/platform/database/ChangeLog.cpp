#include "platform/database/ChangeLog.h"

#include "platform/database/SqlConnection.h"
#include "platform/database/StudyContent.h"

namespace Kxg
{

void noteChange(SqlConnection& connection, const StudyChangeNote& change)
{
    connection.change("INSERT INTO change (position, kind, study_uid, from_uid, to_uid, instance_count, at)"
                      " SELECT COALESCE(MAX(position), 0) + 1, CAST(? AS SMALLINT), CAST(? AS TEXT),"
                      " CAST(? AS TEXT), CAST(? AS TEXT), CAST(? AS BIGINT), CAST(? AS BIGINT) FROM change",
                      {static_cast<int>(change.kind), textValue(change.studyInstanceUID),
                       textValue(change.movedFrom), textValue(change.movedTo), change.instances,
                       presentMs()});
}

std::vector<StudyChangeNote> changesAfter(SqlConnection& connection, qint64 position, int limit)
{
    std::vector<StudyChangeNote> changes;
    SqlRows rows = connection.ask("SELECT kind, study_uid, from_uid, to_uid, instance_count, position, at"
                                  " FROM change WHERE position > ? ORDER BY position LIMIT ?",
                                  {position, limit});
    while (rows.next())
        changes.push_back({static_cast<ChangeKind>(rows.number(0)), rows.text(1), rows.text(2), rows.text(3),
                           static_cast<int>(rows.number(4)), rows.number(5), rows.number(6)});
    return changes;
}

}  // namespace Kxg
