#include "server/dimse/EventReport.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctk.h>
#include <dcmtk/dcmnet/dimse.h>
#include <kddlib/LogFile.h>

#include <cstring>

namespace Kdd::Dimse
{

bool EventReport::send(T_ASC_Association& association, quint8 context, quint16 message) const
{
    T_DIMSE_Message request;
    std::memset(&request, 0, sizeof request);
    request.CommandField = DIMSE_N_EVENT_REPORT_RQ;
    T_DIMSE_N_EventReportRQ& to = request.msg.NEventReportRQ;
    to.MessageID = message;
    qstrncpy(to.AffectedSOPClassUID, sopClass.constData(), sizeof to.AffectedSOPClassUID);
    qstrncpy(to.AffectedSOPInstanceUID, sopInstance.constData(), sizeof to.AffectedSOPInstanceUID);
    to.EventTypeID = event;
    to.DataSetType = DIMSE_DATASET_PRESENT;
    return DIMSE_sendMessageUsingMemoryData(&association, context, &request, nullptr, content().get(),
                                            nullptr, nullptr)
        .good();
}

bool isReportAnswer(const T_DIMSE_Message& answer, quint16 message)
{
    const T_DIMSE_N_EventReportRSP& said = answer.msg.NEventReportRSP;
    if (answer.CommandField != DIMSE_N_EVENT_REPORT_RSP || said.MessageIDBeingRespondedTo != message ||
        said.DataSetType != DIMSE_DATASET_NULL)
        return false;
    if (said.DimseStatus != STATUS_Success)
        LogFile::warnf("A report of an event was answered by status %04X", unsigned(said.DimseStatus));
    return true;
}

}  // namespace Kdd::Dimse
