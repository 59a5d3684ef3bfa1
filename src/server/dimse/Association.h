#pragma once

#include "server/dimse/AssociationDoor.h"
#include "server/dimse/AssociationObserver.h"
#include "server/dimse/DimseSettings.h"
#include "server/dimse/EventReport.h"
#include "server/dimse/ServiceProvider.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmnet/dimse.h>

#include <deque>
#include <functional>
#include <memory>
#include <vector>

class DcmDataset;
class DcmOutputStream;

namespace Kdd::Dimse
{

using Providers = std::vector<std::shared_ptr<ServiceProvider>>;

/// One association from its request to its end, on the thread that runs it: is accepted or rejected by the rules, and has
/// each message answered by the provider of its class. Used by that thread.
class Association
{
public:
    /// What is given outlives it. The connection is the one beneath `dcmtk`.
    Association(DcmtkAssociation dcmtk, PeerConnection& connection, Caller caller,
                const DimseSettings& settings, const Providers& providers, AssociationObserver& observer,
                quint64 id);
    ~Association();

    /// Accepts it and answers messages until it ends, or until the server stops and a message is answered.
    void run();

    /// Turns it down for the time being, because there are too many.
    void rejectForNow();

    // For providers.

    const Caller& caller() const { return mRecord.caller; }
    const QByteArray& calledTitle() const { return mRecord.called; }
    quint64 id() const { return mRecord.id; }  ///< by which log lines name it
    const AssociationRules& rules() const { return mSettings.rules; }

    /// For DCMTK's functions that send: on the association's thread, and not kept.
    T_ASC_Association& dcmtk() { return *mDcmtk; }

    /// All that were accepted.
    const std::vector<PresentationContext>& contexts() const { return mContexts; }

    /// Under which objects of the class in that transfer syntax can be sent to the other side; null when there is none.
    const PresentationContext* contextToSend(const QByteArray& sopClass,
                                             const QByteArray& transferSyntax) const;

    /// Receives the dataset of a message into `stream` as it comes, of at most `most` bytes. False: the association is lost.
    bool receive(const Command& command, DcmOutputStream& stream, qint64 most);

    /// Receives a dataset that is meant to be small, of at most `most` bytes, as identifiers of searches are. Null: the
    /// association is lost; `isGood` is false when the dataset came and cannot be read.
    std::unique_ptr<DcmDataset> receiveIdentifier(const Command& command, bool& isGood,
                                                  qint64 most = kMostIdentifier);

    /// Sends an answer, with a dataset where there is one, and `detail` on the status. False: the association is lost.
    bool send(const PresentationContext& context, T_DIMSE_Message& message, DcmDataset* dataset = nullptr,
              DcmDataset* detail = nullptr);

    /// Whether the other side asked to cancel that message; does not wait.
    bool isCancelled(const PresentationContext& context, quint16 messageId);

    /// Receives the answer to a message that was sent over the association. False: the association is lost.
    bool receiveAnswer(T_DIMSE_Message& answer);

    /// Tells the other side of an event as soon as it rests, for it may be about to leave and wait for an association of ours.
    /// `ended` is called once, on this thread: with true when it has answered, else when the association has ended.
    void report(const PresentationContext& context, EventReport report, std::function<void(bool)> ended);

    /// Whether the server stops: what is on its way shall come to an end.
    bool isStopping() const { return mConnection.isStopping(); }

    /// What else is connected for the sake of the association.
    BreakSwitch& breakSwitch() { return mConnection.breakSwitch(); }

    std::chrono::seconds patience() const { return mSettings.patience; }

    /// Adds to what the association is reported to have done.
    void note(const Performed& performed);

private:
    struct WaitingReport
    {
        quint8 context = 0;
        EventReport report;
        std::function<void(bool)> ended;
        std::optional<quint16> message;  // by which it was sent
    };

    /// Of an identifier [bytes]; one with a list of a thousand UIDs has as much.
    static constexpr qint64 kMostIdentifier = 64 * 1024;

    bool isWelcome();
    void reject(T_ASC_RejectParametersResult result, T_ASC_RejectParametersReason reason, const char* why);
    bool negotiate();
    void negotiate(const T_ASC_PresentationContext& proposed);
    bool isAllowed(const ServiceProvider* provider) const;
    bool answerNext();
    bool receiveNext();
    bool endRest();
    std::chrono::milliseconds restTime() const;
    bool sendReport(WaitingReport& waiting);
    bool endReport(const T_DIMSE_Message& answer);
    bool answer(T_ASC_PresentationContextID id, T_DIMSE_Message& message);
    void endBy(const OFCondition& condition);
    void abort();
    const PresentationContext* contextOf(int id) const;

    DcmtkAssociation mDcmtk;
    PeerConnection& mConnection;
    const DimseSettings& mSettings;
    const Providers& mProviders;
    AssociationObserver& mObserver;
    std::vector<PresentationContext> mContexts;
    std::deque<WaitingReport> mReports;  // the first may have been sent
    AssociationRecord mRecord;
    std::chrono::steady_clock::time_point mBegun = std::chrono::steady_clock::now();
};

}  // namespace Kdd::Dimse
