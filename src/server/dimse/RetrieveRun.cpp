#include "server/dimse/RetrieveRun.h"

#include <dcmtk/dcmdata/dctk.h>

#include <algorithm>
#include <cstring>
#include <limits>

namespace Kdd::Dimse
{
namespace
{

// Of retrievals only.
constexpr quint16 kSomeFailed = 0xB000;
constexpr quint16 kAllFailed = 0xA702;

/// What the length of a UI value can tell [bytes]; of more that failed their number is told alone.
constexpr int kMostFailedUIDs = 65534;

quint16 number(std::size_t count)
{
    return static_cast<quint16>(std::min<std::size_t>(count, std::numeric_limits<quint16>::max()));
}

/// Of a request, or an answer to one: C-MOVE and C-GET are alike in all but the names of their types.
template <typename Answer, typename Request>
void fill(Answer& answer, const Request& request, quint16 status, bool hasDataset)
{
    answer.MessageIDBeingRespondedTo = request.MessageID;
    std::memcpy(answer.AffectedSOPClassUID, request.AffectedSOPClassUID, sizeof answer.AffectedSOPClassUID);
    answer.DimseStatus = status;
    answer.DataSetType = hasDataset ? DIMSE_DATASET_PRESENT : DIMSE_DATASET_NULL;
}

}  // namespace

RetrieveRun::RetrieveRun(const Command& command, Association& association)
    : mCommand(command)
    , mAssociation(association)
    , mIsMove(command.message.CommandField == DIMSE_C_MOVE_RQ)
    , mMessage(mIsMove ? command.message.msg.CMoveRQ.MessageID : command.message.msg.CGetRQ.MessageID)
{
}

bool RetrieveRun::refuse(const QueryEnding& ending)
{
    return finish(ending, 0);
}

bool RetrieveRun::run(const std::vector<RetrieveItem>& items, const RetrieveSource& source,
                      RetrieveTarget& target)
{
    mRemaining = items.size();
    for (std::size_t i = 0; i < items.size(); ++i) {
        if (isCancelled(target))
            return finish({kCancelled, {}}, target.sentBytes());
        if (mAssociation.isStopping()) {
            failFrom(items, i);
            return finish({ending().status, QStringLiteral("The server stops")}, target.sentBytes());
        }
        const Sent sent = sendNext(items, i, source, target);
        if (sent == Sent::Lost) {
            failFrom(items, i);
            if (!target.isSameAssociation())
                break;
            // In the middle of an object no answer has a place.
            note(ending(), target.sentBytes());
            return false;
        }
        count(sent, items[i]);
        if (mRemaining > 0 && !answer({kPending, {}}))
            return false;
    }
    return finish(ending(), target.sentBytes());
}

Sent RetrieveRun::sendNext(const std::vector<RetrieveItem>& items, std::size_t index,
                           const RetrieveSource& source, RetrieveTarget& target)
{
    // A study that changes while it is sent is sent as it was when its turn came.
    const RetrieveItem& item = items[index];
    if (mStudyUID != item.study || mStudy == nullptr) {
        mStudyUID = item.study;
        source.studies.find(item.study, mStudy);
    }
    return mStudy != nullptr ? target.send(items, index, *mStudy) : Sent::Failed;
}

void RetrieveRun::failFrom(const std::vector<RetrieveItem>& items, std::size_t index)
{
    for (; index < items.size(); ++index)
        count(Sent::Failed, items[index]);
}

void RetrieveRun::count(Sent sent, const RetrieveItem& item)
{
    --mRemaining;
    ++(sent == Sent::Stored ? mCompleted : sent == Sent::Warned ? mWarned : mFailed);
    const bool isFailed = sent == Sent::Failed || sent == Sent::Lost;
    if (isFailed && mFailedUIDs.size() + 1 + item.image.sopUID.size() <= kMostFailedUIDs)
        mFailedUIDs += (mFailedUIDs.isEmpty() ? "" : "\\") + item.image.sopUID;
}

QueryEnding RetrieveRun::ending() const
{
    if (mFailed == 0 && mWarned == 0)
        return {};
    if (mCompleted == 0 && mWarned == 0)
        return {kAllFailed, QStringLiteral("No object could be sent")};
    return {kSomeFailed, QStringLiteral("%1 objects could not be sent").arg(mFailed)};
}

bool RetrieveRun::isCancelled(const RetrieveTarget& target)
{
    return target.isCancelled() || mAssociation.isCancelled(mCommand.context, mMessage);
}

bool RetrieveRun::answer(const QueryEnding& ending)
{
    // How many are left is told as long as some are.
    const bool isOpen = ending.status == kPending || ending.status == kCancelled;
    const bool hasUIDs = ending.status != kPending && !mFailedUIDs.isEmpty();
    DcmDataset detail;
    DcmDataset failed;
    describe(ending, detail);
    if (hasUIDs)
        failed.putAndInsertString(DCM_FailedSOPInstanceUIDList, mFailedUIDs.constData());

    T_DIMSE_Message message;
    std::memset(&message, 0, sizeof message);
    const auto counts = [&](auto& to) {
        to.NumberOfRemainingSubOperations = number(mRemaining);
        to.NumberOfCompletedSubOperations = number(mCompleted);
        to.NumberOfFailedSubOperations = number(mFailed);
        to.NumberOfWarningSubOperations = number(mWarned);
    };
    if (mIsMove) {
        message.CommandField = DIMSE_C_MOVE_RSP;
        T_DIMSE_C_MoveRSP& to = message.msg.CMoveRSP;
        fill(to, mCommand.message.msg.CMoveRQ, ending.status, hasUIDs);
        counts(to);
        to.opts = O_MOVE_AFFECTEDSOPCLASSUID | O_MOVE_NUMBEROFCOMPLETEDSUBOPERATIONS |
                  O_MOVE_NUMBEROFFAILEDSUBOPERATIONS | O_MOVE_NUMBEROFWARNINGSUBOPERATIONS |
                  (isOpen ? O_MOVE_NUMBEROFREMAININGSUBOPERATIONS : 0);
    } else {
        message.CommandField = DIMSE_C_GET_RSP;
        T_DIMSE_C_GetRSP& to = message.msg.CGetRSP;
        fill(to, mCommand.message.msg.CGetRQ, ending.status, hasUIDs);
        counts(to);
        to.opts = O_GET_AFFECTEDSOPCLASSUID | O_GET_NUMBEROFCOMPLETEDSUBOPERATIONS |
                  O_GET_NUMBEROFFAILEDSUBOPERATIONS | O_GET_NUMBEROFWARNINGSUBOPERATIONS |
                  (isOpen ? O_GET_NUMBEROFREMAININGSUBOPERATIONS : 0);
    }
    return mAssociation.send(mCommand.context, message, hasUIDs ? &failed : nullptr,
                             detail.isEmpty() ? nullptr : &detail);
}

void RetrieveRun::note(const QueryEnding& ending, qint64 bytes)
{
    Performed performed;
    performed.method = mIsMove ? "C-MOVE" : "C-GET";
    performed.isDone = ending.good() || ending.status == kCancelled;
    performed.studyUID = mStudyUID;
    performed.bytes = bytes;
    mAssociation.note(performed);
}

bool RetrieveRun::finish(const QueryEnding& ending, qint64 bytes)
{
    note(ending, bytes);
    return answer(ending);
}

bool receiveRetrieval(const Command& command, Association& association, QueryRoot root,
                      const RetrieveSource& source, std::vector<RetrieveItem>& items, QueryEnding& ending)
{
    bool isGood = false;
    const std::unique_ptr<DcmDataset> dataset = association.receiveIdentifier(command, isGood);
    if (dataset == nullptr)
        return false;
    RetrieveIdentifier identifier;
    QString reason;
    if (!isGood)
        ending = {kMisunderstood, QStringLiteral("The identifier cannot be read")};
    else if (!RetrieveIdentifier::read(*dataset, root, identifier, reason))
        ending = {kMisunderstood, reason};
    else
        ending = listItems(identifier, association.caller().studies, source, items);
    return true;
}

}  // namespace Kdd::Dimse
