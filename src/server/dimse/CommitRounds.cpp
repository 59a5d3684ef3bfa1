#include "server/dimse/CommitRounds.h"

#include <algorithm>

namespace Kdd::Dimse
{
namespace
{

/// So that an object that takes long holds no others up.
constexpr int kRounds = 2;

/// So many are stored at once, for nobody is answered before all of them are.
constexpr std::size_t kMostAtATime = 50;

}  // namespace

ArrivedObject CommitRounds::commit(std::unique_ptr<ObjectArrival> arrival,
                                   const ObjectStore::Admission& admits)
{
    if (admits) {
        std::vector<std::unique_ptr<ObjectArrival>> alone;
        alone.push_back(std::move(arrival));
        return store(std::move(alone), admits).front();
    }
    Waiting mine;
    mine.arrival = std::move(arrival);
    std::unique_lock<std::mutex> lock(mMutex);
    mWaiting.push_back(&mine);
    while (!mine.isDone) {
        if (!mine.isTaken && mRounds < kRounds)
            runRound(lock);
        else
            mChanged.wait(lock);
    }
    return std::move(mine.object);
}

/// What becomes of each.
std::vector<ArrivedObject> CommitRounds::store(std::vector<std::unique_ptr<ObjectArrival>> whole,
                                               const ObjectStore::Admission& admits)
{
    std::vector<ArrivedObject> objects;
    const Result connected = mArrivals.database().ask([&](Kxg::Catalogue& catalogue) {
        objects = mArrivals.store().commit(whole, catalogue, {}, admits);
        return Result();
    });
    ArrivedObject failed;
    failed.fault = ArrivalFault::Failed;
    failed.reason = connected.text();
    objects.resize(whole.size(), failed);
    return objects;
}

void CommitRounds::runRound(std::unique_lock<std::mutex>& lock)
{
    const auto count = static_cast<std::ptrdiff_t>(std::min(mWaiting.size(), kMostAtATime));
    const std::vector<Waiting*> taken(mWaiting.begin(), mWaiting.begin() + count);
    mWaiting.erase(mWaiting.begin(), mWaiting.begin() + count);
    std::vector<std::unique_ptr<ObjectArrival>> whole;
    for (Waiting* each : taken) {
        each->isTaken = true;
        whole.push_back(std::move(each->arrival));
    }
    ++mRounds;
    lock.unlock();
    std::vector<ArrivedObject> objects = store(std::move(whole), {});
    lock.lock();
    --mRounds;
    for (std::size_t i = 0; i < taken.size(); ++i) {
        taken[i]->object = std::move(objects[i]);
        taken[i]->isDone = true;
    }
    mChanged.notify_all();
}

}  // namespace Kdd::Dimse
