#include "server/dimse/FindProvider.h"

#include "server/dimse/Association.h"
#include "server/dimse/FindSearch.h"
#include "server/dimse/QueryAnswer.h"

#include <dcmtk/dcmdata/dctk.h>

#include <algorithm>
#include <cstring>

namespace Kdd::Dimse
{
namespace
{

const char* const kPatientRoot = UID_FINDPatientRootQueryRetrieveInformationModel;
const char* const kStudyRoot = UID_FINDStudyRootQueryRetrieveInformationModel;

/// Sends the answers to one question.
class Answering
{
public:
    Answering(const Command& command, Association& association)
        : mCommand(command)
        , mRequest(command.message.msg.CFindRQ)
        , mAssociation(association)
    {
    }

    bool isCancelled() { return mAssociation.isCancelled(mCommand.context, mRequest.MessageID); }

    bool sendFound(quint16 status, DcmDataset& found) { return send(status, &found, nullptr); }

    bool sendEnd(const QueryEnding& ending)
    {
        DcmDataset detail;
        describe(ending, detail);
        Performed performed;
        performed.method = "C-FIND";
        performed.isDone = ending.good() || ending.status == kCancelled;
        mAssociation.note(performed);
        return send(ending.status, nullptr, detail.isEmpty() ? nullptr : &detail);
    }

private:
    bool send(quint16 status, DcmDataset* found, DcmDataset* detail)
    {
        T_DIMSE_Message message;
        std::memset(&message, 0, sizeof message);
        message.CommandField = DIMSE_C_FIND_RSP;
        T_DIMSE_C_FindRSP& answer = message.msg.CFindRSP;
        answer.MessageIDBeingRespondedTo = mRequest.MessageID;
        std::memcpy(answer.AffectedSOPClassUID, mRequest.AffectedSOPClassUID,
                    sizeof answer.AffectedSOPClassUID);
        answer.opts = O_FIND_AFFECTEDSOPCLASSUID;
        answer.DataSetType = found != nullptr ? DIMSE_DATASET_PRESENT : DIMSE_DATASET_NULL;
        answer.DimseStatus = status;
        return mAssociation.send(mCommand.context, message, found, detail);
    }

    const Command& mCommand;
    const T_DIMSE_C_FindRQ& mRequest;
    Association& mAssociation;
};

bool showsAll(const QueryIdentifier& question)
{
    return std::all_of(question.keys.begin(), question.keys.end(),
                       [&](const QueryKey& key) { return question.shows(key.key); });
}

}  // namespace

bool FindProvider::provides(const QByteArray& sopClass) const
{
    return sopClass == kPatientRoot || sopClass == kStudyRoot;
}

bool FindProvider::handle(const Command& command, Association& association)
{
    if (command.message.CommandField != DIMSE_C_FIND_RQ ||
        command.message.msg.CFindRQ.DataSetType == DIMSE_DATASET_NULL)
        return false;
    bool isGood = false;
    const std::unique_ptr<DcmDataset> dataset = association.receiveIdentifier(command, isGood);
    if (dataset == nullptr)
        return false;

    Answering answering(command, association);
    QueryIdentifier question;
    QString reason = QStringLiteral("The identifier cannot be read");
    if (isGood) {
        reason.clear();
        const QueryRoot root =
            command.context.sopClass == kPatientRoot ? QueryRoot::Patient : QueryRoot::Study;
        isGood = QueryIdentifier::read(*dataset, root, question, reason);
    }
    if (!isGood)
        return answering.sendEnd({kMisunderstood, reason});

    std::vector<QByteArray> found;
    question.search.limit = mMostAnswers;
    const QueryEnding ending =
        findObjects(question.search, association.caller().studies, mDatabase, mShelf, found);
    const quint16 status = showsAll(question) ? kPending : kPendingWithoutKeys;
    for (const QByteArray& json : found) {
        if (answering.isCancelled())
            return answering.sendEnd({kCancelled, {}});
        DcmDataset answer;
        fillAnswer(question, json, association.calledTitle(), answer);
        if (!answering.sendFound(status, answer))
            return false;
    }
    return answering.sendEnd(ending);
}

}  // namespace Kdd::Dimse
