#include "server/dimse/QueryEnding.h"

#include <dcmtk/dcmdata/dctk.h>

namespace Kdd::Dimse
{

void describe(const QueryEnding& ending, DcmDataset& detail)
{
    constexpr int kRoom = 64;  // of an LO value, in which "\" would begin another one
    QByteArray comment;
    for (const QChar each : ending.reason.left(kRoom)) {
        const ushort code = each.unicode();
        comment += code >= ' ' && code <= '~' && code != '\\' ? static_cast<char>(code) : '?';
    }
    if (!comment.isEmpty())
        detail.putAndInsertString(DCM_ErrorComment, comment.constData());
}

}  // namespace Kdd::Dimse
