#pragma once

#include "server/dicomweb/Resource.h"
#include "server/dicomweb/store/StoreBody.h"

#include <atomic>

namespace Kdd::DicomWeb
{

/// Takes objects that are sent to the list of studies, or to one study.
class StoreResource : public Resource
{
public:
    /// `arrivals` and `sight` outlive the object.
    StoreResource(ArrivalService& arrivals, const StudySight& sight, const StoreLimits& limits)
        : mArrivals(arrivals)
        , mSight(sight)
        , mLimits(limits)
    {
    }

    bool owns(const ResourcePath& /*path*/) const override { return false; }
    Http::Response answer(const Http::Request& request, const ResourcePath& path) override;
    bool receives(const ResourcePath& path) const override;
    Http::Response receive(const Http::Request& request, const ResourcePath& path) override;

private:
    ArrivalService& mArrivals;
    const StudySight& mSight;
    const StoreLimits mLimits;
    std::atomic<int> mCount{0};  // of requests that are being received
};

}  // namespace Kdd::DicomWeb
