#pragma once

#include "server/dicomweb/search/StudySight.h"
#include "server/dimse/CommitmentCourier.h"
#include "server/dimse/ServiceProvider.h"

namespace Kdd::Dimse
{

/// Answers whoever wants to know whether objects that he sent are safe here (storage commitment by the push model): the
/// request at once, and what is committed by a message of its own, over the same association as long as it is there.
class CommitmentProvider : public ServiceProvider
{
public:
    /// Both outlive the object.
    CommitmentProvider(const DicomWeb::StudySight& sight, CommitmentCourier& courier)
        : mSight(sight)
        , mCourier(courier)
    {
    }

    bool provides(const QByteArray& sopClass) const override;
    std::optional<Right> right() const override { return Right::Store; }
    bool handle(const Command& command, Association& association) override;

private:
    void takeCustodyOf(Commitment& commitment, const Caller& caller) const;

    const DicomWeb::StudySight& mSight;
    CommitmentCourier& mCourier;
};

}  // namespace Kdd::Dimse
