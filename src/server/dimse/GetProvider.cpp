#include "server/dimse/GetProvider.h"

#include "server/dimse/RetrieveRun.h"

#include <dcmtk/dcmdata/dctk.h>

namespace Kdd::Dimse
{
namespace
{

const char* const kPatientRoot = UID_GETPatientRootQueryRetrieveInformationModel;
const char* const kStudyRoot = UID_GETStudyRootQueryRetrieveInformationModel;

std::vector<SendContext> contextsToSend(const Association& association)
{
    std::vector<SendContext> contexts;
    for (const PresentationContext& each : association.contexts()) {
        if (each.isSent)
            contexts.push_back({each.id, each.sopClass, each.transferSyntax});
    }
    return contexts;
}

class SameAssociation : public RetrieveTarget
{
public:
    SameAssociation(Association& association, DicomWeb::ObjectShelf& objects, const T_DIMSE_C_GetRQ& request)
        : mObjects(objects)
        , mMessage(request.MessageID)
        , mSender(association.dcmtk(), contextsToSend(association),
                  [&association](T_DIMSE_Message& answer) { return association.receiveAnswer(answer); })
    {
        mOrder.priority = request.Priority;
        mOrder.patience = association.patience();
    }

    Sent send(const std::vector<RetrieveItem>& items, std::size_t index,
              const DicomWeb::ServedStudy& study) override
    {
        return mSender.send(study, items[index], mObjects, mOrder);
    }

    bool isSameAssociation() const override { return true; }
    bool isCancelled() const override { return mSender.isCancelled(mMessage); }
    qint64 sentBytes() const override { return mSender.sentBytes(); }

private:
    DicomWeb::ObjectShelf& mObjects;
    const quint16 mMessage;
    RetrieveSender mSender;
    SendOrder mOrder;
};

}  // namespace

bool GetProvider::provides(const QByteArray& sopClass) const
{
    return sopClass == kPatientRoot || sopClass == kStudyRoot;
}

/// Whatever somebody wants to take may be there: classes that no table knows are stored too.
bool GetProvider::sends(const QByteArray& /*sopClass*/) const
{
    return true;
}

/// Without compression everything can be sent that there is a decoder for, so that is chosen wherever it is proposed. Who
/// wants objects as they are stored proposes their syntax in a context of its own.
QByteArray GetProvider::chooseTransferSyntax(const QVector<QByteArray>& proposed) const
{
    const QByteArray plain = ServiceProvider::chooseTransferSyntax(proposed);
    return !plain.isEmpty() ? plain : proposed.value(0);
}

bool GetProvider::handle(const Command& command, Association& association)
{
    if (command.message.CommandField != DIMSE_C_GET_RQ ||
        command.message.msg.CGetRQ.DataSetType == DIMSE_DATASET_NULL)
        return false;
    std::vector<RetrieveItem> items;
    QueryEnding ending;
    const QueryRoot root = command.context.sopClass == kPatientRoot ? QueryRoot::Patient : QueryRoot::Study;
    if (!receiveRetrieval(command, association, root, mSource, items, ending))
        return false;
    RetrieveRun run(command, association);
    if (ending.bad())
        return run.refuse(ending);
    SameAssociation target(association, mSource.objects, command.message.msg.CGetRQ);
    return run.run(items, mSource, target);
}

}  // namespace Kdd::Dimse
