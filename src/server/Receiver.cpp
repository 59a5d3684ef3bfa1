#include "server/Receiver.h"

#include "server/dicomweb/store/ArrivalService.h"

namespace Kdd
{

std::unique_ptr<Receiver> Receiver::make(const Dimse::DimseSettings& settings, const QByteArray& audit,
                                         bool isDecided, const ObjectRules& objects, Result& result)
{
    std::unique_ptr<Receiver> made(new Receiver);
    made->mStopTime = settings.stop;
    made->mArchive.arrivals = DicomWeb::ArrivalService::make(objects, Kxg::DatabaseServer(), result);
    if (result.bad())
        return nullptr;
    made->mArchive.studies->setArrivals(made->mArchive.arrivals.get());
    made->mService = DimseService::make(settings, audit, isDecided, made->mArchive, result);
    return result.good() ? std::move(made) : nullptr;
}

Receiver::~Receiver()
{
    stop();
}

Result Receiver::start()
{
    const Result result = mService->start();
    mIsRunning = result.good();
    if (mIsRunning)
        mArchive.arrivals->start();
    return result;
}

void Receiver::stop()
{
    if (!mIsRunning)
        return;
    mIsRunning = false;
    mService->stop();
    mArchive.arrivals->stop(mStopTime);
}

}  // namespace Kdd
