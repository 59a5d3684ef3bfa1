#include "server/dimse/MoveProvider.h"

#include "server/dimse/OutgoingAssociation.h"
#include "server/dimse/RetrieveRun.h"

#include <dcmtk/dcmdata/dctk.h>
#include <dcmtk/dcmnet/dcmtrans.h>
#include <kddlib/LogFile.h>

namespace Kdd::Dimse
{
namespace
{

const char* const kPatientRoot = UID_MOVEPatientRootQueryRetrieveInformationModel;
const char* const kStudyRoot = UID_MOVEStudyRootQueryRetrieveInformationModel;

constexpr quint16 kUnknownDestination = 0xA801;

/// The application entity that gets the objects, over associations that are opened when they are needed.
class Destination : public RetrieveTarget
{
public:
    Destination(OutgoingAssociation::Parties parties, DicomWeb::ObjectShelf& objects, const SendOrder& order,
                BreakSwitch& breakSwitch)
        : mParties(std::move(parties))
        , mSwitch(breakSwitch)
        , mObjects(objects)
        , mOrder(order)
    {
    }

    Sent send(const std::vector<RetrieveItem>& items, std::size_t index,
              const DicomWeb::ServedStudy& study) override
    {
        if (mAssociation == nullptr || !isProposed(mProposals, items[index])) {
            close();
            if (!open(items, index))
                return Sent::Lost;
        }
        const Sent sent = mSender->send(study, items[index], mObjects, mOrder);
        if (sent != Sent::Lost) {
            mIsUsed = true;
            return sent;
        }
        mAssociation->breakOff();
        const bool wasUsed = mIsUsed;
        close();
        // One that took something before may take more when it is asked again.
        return wasUsed ? Sent::Failed : Sent::Lost;
    }

    bool isSameAssociation() const override { return false; }
    qint64 sentBytes() const override { return mSentBytes + (mSender != nullptr ? mSender->sentBytes() : 0); }

private:
    bool open(const std::vector<RetrieveItem>& items, std::size_t index)
    {
        Result result;
        mProposals = proposalsFor(items, index);
        mAssociation = OutgoingAssociation::open(mParties, mProposals, mSwitch, result);
        if (mAssociation == nullptr) {
            LogFile::warnf("Nothing can be sent to \"%s\": %s", mParties.title.constData(),
                           qUtf8Printable(result.text()));
            return false;
        }
        mSender = std::make_unique<RetrieveSender>(
            mAssociation->dcmtk(), mAssociation->contexts(),
            [this](T_DIMSE_Message& answer) { return mAssociation->receive(answer); });
        return true;
    }

    void close()
    {
        mSentBytes = sentBytes();
        mSender.reset();
        mAssociation.reset();
        mIsUsed = false;
    }

    const OutgoingAssociation::Parties mParties;
    BreakSwitch& mSwitch;
    DicomWeb::ObjectShelf& mObjects;
    const SendOrder mOrder;
    std::vector<ProposedContext> mProposals;
    std::unique_ptr<OutgoingAssociation> mAssociation;
    std::unique_ptr<RetrieveSender> mSender;
    bool mIsUsed = false;   // something was sent over the present association
    qint64 mSentBytes = 0;  // over the former ones
};

}  // namespace

MoveProvider::MoveProvider(const RetrieveSource& source, std::optional<TlsRules> tls,
                           std::chrono::seconds patience)
    : mSource(source)
    , mTls(std::move(tls))
    , mPatience(patience)
{
    // DCMTK has these for the whole process; nothing else in it lets DCMTK call anybody.
    const auto seconds = static_cast<Sint32>(patience.count());
    dcmConnectionTimeout.set(seconds);
    dcmSocketSendTimeout.set(seconds);
    dcmSocketReceiveTimeout.set(seconds);
}

bool MoveProvider::provides(const QByteArray& sopClass) const
{
    return sopClass == kPatientRoot || sopClass == kStudyRoot;
}

bool MoveProvider::handle(const Command& command, Association& association)
{
    const T_DIMSE_C_MoveRQ& request = command.message.msg.CMoveRQ;
    if (command.message.CommandField != DIMSE_C_MOVE_RQ || request.DataSetType == DIMSE_DATASET_NULL)
        return false;
    std::vector<RetrieveItem> items;
    QueryEnding ending;
    const QueryRoot root = command.context.sopClass == kPatientRoot ? QueryRoot::Patient : QueryRoot::Study;
    if (!receiveRetrieval(command, association, root, mSource, items, ending))
        return false;
    RetrieveRun run(command, association);
    OutgoingAssociation::Parties parties;
    parties.title = QByteArray(request.MoveDestination).trimmed();
    const Peer* const peer = association.rules().find(parties.title);
    if (peer == nullptr || peer->host.isEmpty())
        ending = {kUnknownDestination, QStringLiteral("The destination is none that is called")};
    if (ending.bad())
        return run.refuse(ending);
    parties.ownTitle = association.calledTitle();
    parties.peer = *peer;
    parties.tls = peer->isSecure ? mTls : std::nullopt;
    parties.patience = mPatience;
    Destination destination(std::move(parties), mSource.objects,
                            {request.Priority, association.caller().title, request.MessageID, mPatience},
                            association.breakSwitch());
    return run.run(items, mSource, destination);
}

}  // namespace Kdd::Dimse
