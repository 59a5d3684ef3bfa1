#include "server/dimse/CommitmentProvider.h"

#include "server/dimse/Association.h"

#include <dcmtk/dcmdata/dctk.h>

#include <cstring>

namespace Kdd::Dimse
{
namespace
{

constexpr quint16 kRequestCommitment = 1;  // the one action that there is

constexpr quint16 kNoSuchInstance = 0x0112;
constexpr quint16 kInvalidValue = 0x0115;
constexpr quint16 kNoSuchAction = 0x0123;
constexpr quint16 kResourceLimitation = 0x0213;

bool sendAnswer(const Command& command, Association& association, const QueryEnding& ending)
{
    const T_DIMSE_N_ActionRQ& request = command.message.msg.NActionRQ;
    T_DIMSE_Message message;
    std::memset(&message, 0, sizeof message);
    message.CommandField = DIMSE_N_ACTION_RSP;
    T_DIMSE_N_ActionRSP& answer = message.msg.NActionRSP;
    answer.MessageIDBeingRespondedTo = request.MessageID;
    std::memcpy(answer.AffectedSOPClassUID, request.RequestedSOPClassUID, sizeof answer.AffectedSOPClassUID);
    std::memcpy(answer.AffectedSOPInstanceUID, request.RequestedSOPInstanceUID,
                sizeof answer.AffectedSOPInstanceUID);
    answer.ActionTypeID = request.ActionTypeID;
    answer.opts = O_NACTION_AFFECTEDSOPCLASSUID | O_NACTION_AFFECTEDSOPINSTANCEUID | O_NACTION_ACTIONTYPEID;
    answer.DimseStatus = ending.status;
    answer.DataSetType = DIMSE_DATASET_NULL;
    DcmDataset detail;
    describe(ending, detail);
    return association.send(command.context, message, nullptr, detail.isEmpty() ? nullptr : &detail);
}

/// False: the association is lost.
bool receiveRequest(const Command& command, Association& association, Commitment& commitment,
                    QueryEnding& ending)
{
    const T_DIMSE_N_ActionRQ& request = command.message.msg.NActionRQ;
    bool isGood = false;
    if (request.DataSetType != DIMSE_DATASET_NULL) {
        const std::unique_ptr<DcmDataset> dataset =
            association.receiveIdentifier(command, isGood, kMostCommitmentBytes);
        if (dataset == nullptr)
            return false;
        if (isGood)
            ending = Commitment::read(*dataset, commitment);
    }
    if (!isGood)
        ending = {kInvalidValue, QStringLiteral("The request cannot be read")};
    if (QByteArray(request.RequestedSOPInstanceUID).trimmed() != UID_StorageCommitmentPushModelSOPInstance)
        ending = {kNoSuchInstance, QStringLiteral("It is asked of an instance that there is not")};
    else if (request.ActionTypeID != kRequestCommitment)
        ending = {kNoSuchAction, QStringLiteral("There is no such action")};
    return true;
}

}  // namespace

bool CommitmentProvider::provides(const QByteArray& sopClass) const
{
    return sopClass == UID_StorageCommitmentPushModelSOPClass;
}

bool CommitmentProvider::handle(const Command& command, Association& association)
{
    if (command.message.CommandField != DIMSE_N_ACTION_RQ)
        return false;
    auto answer = std::make_shared<CommitmentAnswer>();
    QueryEnding ending;
    if (!receiveRequest(command, association, answer->commitment, ending))
        return false;
    CommitmentCourier::Room room;
    if (ending.good())
        room = mCourier.reserve(answer->commitment.objects.size());
    if (ending.good() && room == nullptr)
        ending = {kResourceLimitation, QStringLiteral("Too many requests wait for their answers")};
    const bool isSent = sendAnswer(command, association, ending);
    Performed performed;
    performed.method = "N-ACTION";
    performed.isDone = isSent && ending.good();
    if (performed.isDone) {
        takeCustodyOf(answer->commitment, association.caller());
        performed.isDone = answer->commitment.isWhole();
        answer->title = association.caller().title;
        answer->ownTitle = association.calledTitle();
        association.report(command.context, answer->report(), [this, answer, room](bool isTold) {
            if (!isTold)
                mCourier.take(answer, room);
        });
    }
    association.note(performed);
    return isSent;
}

/// What he may not see does not exist.
void CommitmentProvider::takeCustodyOf(Commitment& commitment, const Caller& caller) const
{
    std::vector<ObjectReference>& objects = commitment.objects;
    takeCustody(objects);
    QHash<QByteArray, DicomWeb::Sight> seen;
    for (ObjectReference& object : objects) {
        if (caller.studies == nullptr || object.studyUID.isEmpty())
            continue;
        if (!seen.contains(object.studyUID))
            seen.insert(object.studyUID, mSight.look(caller.studies, object.studyUID));
        const DicomWeb::Sight sight = seen.value(object.studyUID);
        if (sight == DicomWeb::Sight::Hidden)
            object.custody = Custody::Unknown;
        else if (sight == DicomWeb::Sight::Unknown)
            object.custody = Custody::Failed;
    }
}

}  // namespace Kdd::Dimse
