#pragma once

#include "server/DimseLog.h"
#include "server/Resources.h"
#include "server/dimse/CommitmentCourier.h"
#include "server/dimse/DimseListener.h"

namespace Kdd
{

/// What answers DICOM associations over the archive. Used by one thread.
class DimseService
{
public:
    /// The archive, which takes objects, outlives it. `audit` as DimseLog has it. Null, with the reason, when the settings cannot be followed; that
    /// includes an address that other machines reach where `isDecided` does not say that somebody decided who may what.
    static std::unique_ptr<DimseService> make(const Dimse::DimseSettings& settings, const QByteArray& audit,
                                              bool isDecided, ServedArchive& archive, Result& result);

    /// On failure nothing has begun.
    Result start() { return mListener->start(); }
    void stop();

    /// As Server has them.
    bool hasCertificate() const { return mHasCertificate; }
    Result renewCertificate() { return mListener->renewCertificate(); }

    Http::ListenAddress address() const { return mListener->address(); }

    /// As long as this lives.
    void addTo(Http::Metrics& metrics) const;

private:
    DimseService(const Dimse::DimseSettings& settings, const QByteArray& audit);

    DimseLog mLog;
    const Dimse::AssociationRules mRules;
    const bool mHasCertificate;
    std::unique_ptr<Dimse::CommitmentCourier> mCourier;
    std::unique_ptr<Dimse::DimseListener> mListener;
};

}  // namespace Kdd
