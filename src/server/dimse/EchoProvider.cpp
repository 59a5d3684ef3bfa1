#include "server/dimse/EchoProvider.h"

#include "server/dimse/Association.h"

#include <dcmtk/dcmdata/dcuid.h>

namespace Kdd::Dimse
{

bool EchoProvider::provides(const QByteArray& sopClass) const
{
    return sopClass == UID_VerificationSOPClass;
}

bool EchoProvider::handle(const Command& command, Association& association)
{
    if (command.message.CommandField != DIMSE_C_ECHO_RQ ||
        command.message.msg.CEchoRQ.DataSetType != DIMSE_DATASET_NULL)
        return false;
    association.note({"C-ECHO", true, {}, 0});
    return DIMSE_sendEchoResponse(&association.dcmtk(), command.context.id, &command.message.msg.CEchoRQ,
                                  STATUS_Success, nullptr)
        .good();
}

}  // namespace Kdd::Dimse
