#pragma once

#include "server/dimse/AssociationRules.h"
#include "server/dimse/BreakSwitch.h"
#include "server/dimse/DimseSettings.h"
#include "server/dimse/RetrieveSender.h"

#include <kddlib/Result.h>

#include <chrono>
#include <memory>

namespace Kdd::Dimse
{

/// Of objects of a class, any of these transfer syntaxes.
struct ProposedContext
{
    QByteArray sopClass;
    QVector<QByteArray> syntaxes;
    bool isProvided = false;  ///< by us, who tell of events; else the other side is asked to do something
};

/// What to propose so that the items from `index` on can be sent, as many of them as one association has room for: each
/// class without compression, and in whatever compression its objects are stored.
std::vector<ProposedContext> proposalsFor(const std::vector<RetrieveItem>& items, std::size_t index);

/// Whether it is proposed to send the item as it is stored.
bool isProposed(const std::vector<ProposedContext>& proposals, const RetrieveItem& item);

/// An association with another application entity, asked for by us, to send it objects or tell it of events. Used by one
/// thread.
class OutgoingAssociation
{
public:
    struct Parties
    {
        QByteArray ownTitle;
        QByteArray title;
        Peer peer;
        std::optional<TlsRules> tls;  ///< by which our certificate is shown and the other one's judged
        std::chrono::seconds patience{30};
    };

    /// Null, with the reason, when it cannot be had. The switch, which outlives it, breaks it off.
    static std::unique_ptr<OutgoingAssociation> open(const Parties& parties,
                                                     const std::vector<ProposedContext>& proposals,
                                                     BreakSwitch& breakSwitch, Result& result);

    /// Releases it, or breaks it off.
    ~OutgoingAssociation();
    OutgoingAssociation(const OutgoingAssociation&) = delete;
    OutgoingAssociation& operator=(const OutgoingAssociation&) = delete;

    /// Nothing more can be said over it.
    void breakOff() { mIsBroken = true; }

    T_ASC_Association& dcmtk() { return *mAssociation; }

    /// Those that were accepted.
    std::vector<SendContext> contexts() const;

    /// The message that comes next; false: none comes in time, and the association is lost.
    bool receive(T_DIMSE_Message& message);

private:
    OutgoingAssociation() = default;
    Result request(const Parties& parties, const std::vector<ProposedContext>& proposals,
                   BreakSwitch& breakSwitch);

    std::unique_ptr<BreakableSocket> mSocket;  // the last to go
    T_ASC_Network* mNetwork = nullptr;
    T_ASC_Association* mAssociation = nullptr;
    std::chrono::seconds mPatience{0};
    bool mIsBroken = false;
};

}  // namespace Kdd::Dimse
