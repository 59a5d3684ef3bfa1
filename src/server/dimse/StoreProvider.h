#pragma once

#include "server/dicomweb/search/StudySight.h"
#include "server/dimse/CommitRounds.h"
#include "server/dimse/ServiceProvider.h"

namespace Kdd::Dimse
{

/// Takes objects into the archive, as they are sent. One is told as stored when it is on the disk and registered.
class StoreProvider : public ServiceProvider
{
public:
    /// Both outlive the object.
    StoreProvider(DicomWeb::ArrivalService& arrivals, const DicomWeb::StudySight& sight,
                  bool takesUnknownClasses)
        : mArrivals(arrivals)
        , mSight(sight)
        , mRounds(arrivals)
        , mTakesUnknownClasses(takesUnknownClasses)
    {
    }

    bool provides(const QByteArray& sopClass) const override;
    std::optional<Right> right() const override { return Right::Store; }

    /// The first that the archive can read: senders name the form first that their objects have. Implicit VR Little Endian and
    /// Explicit VR Big Endian come last, for much is easier with Explicit VR Little Endian.
    QByteArray chooseTransferSyntax(const QVector<QByteArray>& proposed) const override;

    bool handle(const Command& command, Association& association) override;

private:
    DicomWeb::ArrivalService& mArrivals;
    const DicomWeb::StudySight& mSight;
    CommitRounds mRounds;
    const bool mTakesUnknownClasses;
};

/// Whether objects of the class are ones that are stored with patients and studies: a standard one, also one that is newer
/// than this program, or, if wanted, one that a manufacturer made up.
bool isStorageClass(const QByteArray& sopClass, bool withUnknown);

}  // namespace Kdd::Dimse
