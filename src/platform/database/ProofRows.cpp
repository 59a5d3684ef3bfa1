#include "platform/database/ProofRows.h"

#include "platform/database/SqlConnection.h"
#include "platform/database/StudyProofs.h"

namespace Kxg
{

void keepFormerTagFile(SqlConnection& connection, qint64 studyId, const TagFileStamp& next)
{
    TagFileStamp last;
    {
        SqlRows rows =
            connection.ask("SELECT tag_file_size, tag_file_digest FROM study WHERE id = ?", {studyId});
        if (rows.next())
            last = {rows.number(0), rows.bytes(1)};
    }
    if (last.digest.isEmpty() || last == next)
        return;
    connection.change("INSERT INTO former_tag_file (study_id, size, digest) VALUES (?, ?, ?)",
                      {studyId, last.size, bytesValue(last.digest)});
    connection.change(
        "DELETE FROM former_tag_file WHERE study_id = ? AND id <= (SELECT id FROM former_tag_file"
        " WHERE study_id = ? ORDER BY id DESC LIMIT 1 OFFSET ?)",
        {studyId, studyId, kMostFormerTagFiles});
}

}  // namespace Kxg
