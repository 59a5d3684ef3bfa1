#pragma once

#include "server/dimse/BreakSwitch.h"
#include "server/dimse/Commitment.h"
#include "server/dimse/EventReport.h"
#include "server/dimse/OutgoingAssociation.h"

#include <condition_variable>
#include <deque>
#include <map>
#include <mutex>
#include <thread>

namespace Kdd::Dimse
{

/// An answer to a request for storage commitment, which may be sent to who asked over an association of ours.
struct CommitmentAnswer
{
    QByteArray title;     ///< of who asked
    QByteArray ownTitle;  ///< by which the server was asked
    Commitment commitment;

    EventReport report() const;
};

/// Brings answers to those who have left meanwhile, by associations of ours, again and again where they cannot be had; what
/// was not brought when the server ends is lost, and whoever waits for it has to ask again. May be used on any thread.
class CommitmentCourier
{
public:
    /// The rules outlive the object, and know by where peers are called.
    CommitmentCourier(const AssociationRules& rules, std::optional<TlsRules> tls,
                      std::chrono::seconds patience);

    /// Stops.
    ~CommitmentCourier();
    CommitmentCourier(const CommitmentCourier&) = delete;
    CommitmentCourier& operator=(const CommitmentCourier&) = delete;

    /// Whether there is room for answers about so many objects more; it is taken for as long as what is returned lives. Null:
    /// there is none.
    using Room = std::shared_ptr<void>;
    Room reserve(std::size_t objects);

    /// An answer, with its room.
    void take(std::shared_ptr<const CommitmentAnswer> answer, Room room);

    /// Brings nothing more, and breaks off what it is bringing.
    void stop();

private:
    using Clock = std::chrono::steady_clock;

    struct Carried
    {
        std::shared_ptr<const CommitmentAnswer> answer;
        Room room;
        Clock::time_point end;  // after which it is not tried any more
    };

    /// What waits for one peer.
    struct Waiting
    {
        std::deque<Carried> answers;
        Clock::time_point due;
        std::chrono::seconds pause{0};  // before the present attempt
    };

    void work();
    void bring(std::unique_lock<std::mutex>& lock, const QByteArray& title);
    std::size_t deliver(const QByteArray& title, const std::deque<Carried>& answers);

    const AssociationRules& mRules;
    const std::optional<TlsRules> mTls;
    const std::chrono::seconds mPatience;
    BreakSwitch mSwitch;
    std::mutex mMutex;
    std::condition_variable mChanged;
    std::map<QByteArray, Waiting> mWaiting;  // by title
    std::size_t mRequests = 0;               // for which there is room taken
    std::size_t mObjects = 0;
    bool mIsStopped = false;
    std::thread mThread;
};

}  // namespace Kdd::Dimse
