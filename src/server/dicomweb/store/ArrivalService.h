#pragma once

#include "server/dicomweb/Arrivals.h"
#include "server/dicomweb/store/ThreadCatalogue.h"

#include <kddlib/ArrivedStudies.h>
#include <kddlib/ObjectStore.h>

#include <condition_variable>
#include <thread>
#include <vector>

namespace Kdd::DicomWeb
{

/// Takes objects in and, on threads of its own, brings them into the tag files of their studies, for many at a time. May be
/// used on any thread; `start` and `stop` by one.
class ArrivalService : public Arrivals
{
public:
    /// Null, with the reason, when objects cannot be stored where the rules say.
    static std::unique_ptr<ArrivalService> make(const ObjectRules& rules, const QByteArray& database,
                                                Result& result);

    ~ArrivalService() override;

    /// Looks after what was left by servers that died, as soon as the database answers, and then brings in what arrives.
    void start();

    /// Brings in what has arrived, as far as it can in that time; the rest waits in the database.
    void stop(std::chrono::milliseconds time);

    ObjectStore& store() { return *mStore; }
    const ThreadCatalogue& database() const { return mDatabase; }

    Arrived bringIn(const QByteArray& studyUID) override;
    bool isRegistered(const QByteArray& studyUID, const QByteArray& sopInstanceUID) override;
    void takeOver(const QByteArray& studyUID) override { mStudies.addWaiting(studyUID); }
    void bringInOwn(const QByteArray& studyUID) override;

private:
    explicit ArrivalService(const QByteArray& database)
        : mDatabase(database)
    {
    }

    void prepare();
    void work();
    Result complete(const QByteArray& studyUID, int patienceMs);

    ThreadCatalogue mDatabase;
    ArrivedStudies mStudies;
    std::unique_ptr<ObjectStore> mStore;
    std::vector<std::thread> mThreads;
    std::mutex mMutex;
    std::condition_variable mChanged;
    bool mIsStopped = false;
    std::chrono::steady_clock::time_point mEnd;
};

}  // namespace Kdd::DicomWeb
