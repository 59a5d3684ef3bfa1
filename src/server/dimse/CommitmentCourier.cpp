#include "server/dimse/CommitmentCourier.h"

#include <dcmtk/dcmdata/dctk.h>
#include <kddlib/LogFile.h>

#include <algorithm>

namespace Kdd::Dimse
{
namespace
{

// All that waits takes some 200 bytes for each object.
constexpr std::size_t kMostRequests = 1000;
constexpr std::size_t kMostObjects = 200000;

// A modality that is switched off is called seldom, and not for ever: it asks again when it wants to know.
constexpr std::chrono::seconds kFirstPause(10);
constexpr std::chrono::seconds kLongestPause(3600);
constexpr std::chrono::hours kLongest(24);

void tellLost(const CommitmentAnswer& answer, const char* why)
{
    LogFile::warnf("\"%s\" is not told what is committed of its request %s: %s", answer.title.constData(),
                   answer.commitment.transaction.constData(), why);
}

}  // namespace

EventReport CommitmentAnswer::report() const
{
    EventReport made;
    made.sopClass = UID_StorageCommitmentPushModelSOPClass;
    made.sopInstance = UID_StorageCommitmentPushModelSOPInstance;
    made.event = commitment.isWhole() ? 1 : 2;
    made.content = [this] { return commitment.answer(ownTitle); };
    return made;
}

CommitmentCourier::CommitmentCourier(const AssociationRules& rules, std::optional<TlsRules> tls,
                                     std::chrono::seconds patience)
    : mRules(rules)
    , mTls(std::move(tls))
    , mPatience(patience)
{
}

CommitmentCourier::~CommitmentCourier()
{
    stop();
}

CommitmentCourier::Room CommitmentCourier::reserve(std::size_t objects)
{
    const std::lock_guard<std::mutex> lock(mMutex);
    if (mRequests >= kMostRequests || mObjects + objects > kMostObjects)
        return nullptr;
    ++mRequests;
    mObjects += objects;
    return Room(this, [objects](void* courier) {
        auto& self = *static_cast<CommitmentCourier*>(courier);
        const std::lock_guard<std::mutex> given(self.mMutex);
        --self.mRequests;
        self.mObjects -= objects;
    });
}

void CommitmentCourier::take(std::shared_ptr<const CommitmentAnswer> answer, Room room)
{
    const Peer* const peer = mRules.find(answer->title);
    if (peer == nullptr || peer->host.isEmpty())
        return tellLost(*answer, "it has left, and is no peer that can be called");
    const std::lock_guard<std::mutex> lock(mMutex);
    if (mIsStopped)
        return tellLost(*answer, "the server stops");
    // It asked a moment ago, so it is there again.
    Waiting& waiting = mWaiting[answer->title];
    waiting.due = {};
    waiting.pause = {};
    waiting.answers.push_back({std::move(answer), std::move(room), Clock::now() + kLongest});
    if (!mThread.joinable())
        mThread = std::thread([this] { work(); });
    mChanged.notify_one();
}

void CommitmentCourier::stop()
{
    {
        const std::lock_guard<std::mutex> lock(mMutex);
        mIsStopped = true;
        mChanged.notify_one();
    }
    mSwitch.breakOff();
    if (mThread.joinable())
        mThread.join();
    for (const auto& [title, waiting] : mWaiting) {
        for (const Carried& each : waiting.answers)
            tellLost(*each.answer, "the server stops");
    }
    mWaiting.clear();
}

void CommitmentCourier::work()
{
    std::unique_lock<std::mutex> lock(mMutex);
    while (!mIsStopped) {
        const auto next =
            std::min_element(mWaiting.begin(), mWaiting.end(),
                             [](const auto& a, const auto& b) { return a.second.due < b.second.due; });
        if (next == mWaiting.end())
            mChanged.wait(lock);
        else if (next->second.due > Clock::now())
            mChanged.wait_until(lock, next->second.due);
        else
            bring(lock, QByteArray(next->first));
    }
}

/// What comes for the peer meanwhile goes behind.
void CommitmentCourier::bring(std::unique_lock<std::mutex>& lock, const QByteArray& title)
{
    Waiting waiting = std::move(mWaiting[title]);
    mWaiting.erase(title);
    lock.unlock();
    const auto done = static_cast<std::ptrdiff_t>(deliver(title, waiting.answers));
    waiting.answers.erase(waiting.answers.begin(), waiting.answers.begin() + done);
    while (!waiting.answers.empty() && waiting.answers.front().end < Clock::now()) {
        tellLost(*waiting.answers.front().answer, "it could not be called for too long");
        waiting.answers.pop_front();
    }
    lock.lock();
    if (waiting.answers.empty())
        return;
    Waiting& left = mWaiting[title];
    left.pause = std::clamp(2 * waiting.pause, kFirstPause, kLongestPause);
    left.due = Clock::now() + left.pause;
    left.answers.insert(left.answers.begin(), std::make_move_iterator(waiting.answers.begin()),
                        std::make_move_iterator(waiting.answers.end()));
}

/// How many of them were.
std::size_t CommitmentCourier::deliver(const QByteArray& title, const std::deque<Carried>& answers)
{
    const Peer& peer = *mRules.find(title);
    OutgoingAssociation::Parties parties;
    parties.ownTitle = answers.front().answer->ownTitle;
    parties.title = title;
    parties.peer = peer;
    parties.tls = peer.isSecure ? mTls : std::nullopt;
    parties.patience = mPatience;
    const ProposedContext proposal = {
        UID_StorageCommitmentPushModelSOPClass,
        {UID_LittleEndianExplicitTransferSyntax, UID_LittleEndianImplicitTransferSyntax},
        true};
    Result result;
    const auto association = OutgoingAssociation::open(parties, {proposal}, mSwitch, result);
    const std::vector<SendContext> contexts =
        association != nullptr ? association->contexts() : std::vector<SendContext>();
    if (association != nullptr && contexts.empty())
        result = Result::failure(QStringLiteral("It does not want to be told"));
    if (result.bad()) {
        LogFile::warnf("\"%s\" cannot be told what is committed: %s", title.constData(),
                       qUtf8Printable(result.text()));
        return 0;
    }
    for (std::size_t i = 0; i < answers.size(); ++i) {
        const quint16 message = association->dcmtk().nextMsgID++;
        T_DIMSE_Message said = {};
        if (!answers[i].answer->report().send(association->dcmtk(), contexts.front().id, message) ||
            !association->receive(said) || !isReportAnswer(said, message)) {
            association->breakOff();
            LogFile::warnf("\"%s\" broke off while it was told what is committed", title.constData());
            return i;
        }
    }
    return answers.size();
}

}  // namespace Kdd::Dimse
