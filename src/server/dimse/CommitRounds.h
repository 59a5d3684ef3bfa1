#pragma once

#include "server/dicomweb/store/ArrivalService.h"

#include <condition_variable>
#include <mutex>
#include <vector>

namespace Kdd::Dimse
{

/// Commits objects of several associations together, where each alone would cost some waits for the disk: whoever comes while
/// others are being stored waits, and is stored with all that came meanwhile. May be used on any thread.
class CommitRounds
{
public:
    /// `arrivals` outlives the object.
    explicit CommitRounds(DicomWeb::ArrivalService& arrivals)
        : mArrivals(arrivals)
    {
    }

    /// Stores an object that has come whole; returns when it is stored for good, or is not. One that only some may store is
    /// stored alone.
    ArrivedObject commit(std::unique_ptr<ObjectArrival> arrival, const ObjectStore::Admission& admits = {});

private:
    struct Waiting
    {
        std::unique_ptr<ObjectArrival> arrival;
        ArrivedObject object;
        bool isTaken = false;
        bool isDone = false;
    };

    std::vector<ArrivedObject> store(std::vector<std::unique_ptr<ObjectArrival>> whole,
                                     const ObjectStore::Admission& admits);
    void runRound(std::unique_lock<std::mutex>& lock);

    DicomWeb::ArrivalService& mArrivals;
    std::mutex mMutex;
    std::condition_variable mChanged;
    std::vector<Waiting*> mWaiting;
    int mRounds = 0;  // that are on their way
};

}  // namespace Kdd::Dimse
