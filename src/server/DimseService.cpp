#include "server/DimseService.h"

#include "server/dimse/CommitmentProvider.h"
#include "server/dimse/EchoProvider.h"
#include "server/dimse/FindProvider.h"
#include "server/dimse/GetProvider.h"
#include "server/dimse/MoveProvider.h"
#include "server/dimse/StoreProvider.h"

#include <kddlib/ExResource.h>

namespace Kdd
{
namespace
{

Dimse::Providers makeProviders(ServedArchive& archive, const Dimse::DimseSettings& settings,
                               Dimse::CommitmentCourier& courier)
{
    const Dimse::RetrieveSource source = {archive.database, *archive.studies, *archive.objects,
                                          archive.sight};
    Dimse::Providers providers;
    providers.push_back(std::make_shared<Dimse::EchoProvider>());
    providers.push_back(std::make_shared<Dimse::StoreProvider>(*archive.arrivals, archive.sight,
                                                               settings.rules.takesUnknownClasses));
    providers.push_back(std::make_shared<Dimse::FindProvider>(archive.database, *archive.studies,
                                                              ExResource::dicomAnswers()));
    providers.push_back(std::make_shared<Dimse::MoveProvider>(source, settings.tls, settings.patience));
    providers.push_back(std::make_shared<Dimse::GetProvider>(source));
    providers.push_back(std::make_shared<Dimse::CommitmentProvider>(archive.sight, courier));
    return providers;
}

Result checkReach(const Http::ListenAddress& address, bool isDecided)
{
    if (isDecided || address.isLoopback())
        return {};
    return Result::failure(
        QStringLiteral(
            "%1 can be reached by other machines, and nobody has decided who may have associations: "
            "name a peers file, or \"none\" where everybody who reaches it may do everything")
            .arg(QString::fromUtf8(address.text())));
}

}  // namespace

std::unique_ptr<DimseService> DimseService::make(const Dimse::DimseSettings& settings,
                                                 const QByteArray& audit, bool isDecided,
                                                 ServedArchive& archive, Result& result)
{
    result = checkReach(settings.address, isDecided);
    std::unique_ptr<DimseService> made(new DimseService(settings, audit));
    if (result.good())
        made->mListener = Dimse::DimseListener::make(
            settings, makeProviders(archive, settings, *made->mCourier), made->mLog, result);
    if (result.good())
        result = made->mLog.check();
    return result.good() ? std::move(made) : nullptr;
}

DimseService::DimseService(const Dimse::DimseSettings& settings, const QByteArray& audit)
    : mLog(audit)
    , mRules(settings.rules)
    , mHasCertificate(settings.tls.has_value())
    , mCourier(std::make_unique<Dimse::CommitmentCourier>(mRules, settings.tls, settings.patience))
{
}

/// What associations have left to be told is told by others, or not at all.
void DimseService::stop()
{
    mListener->stop();
    mCourier->stop();
}

void DimseService::addTo(Http::Metrics& metrics) const
{
    metrics.addGauge("kdd_dicom_associations", "Associations that are open.",
                     [this] { return mListener->associations(); });
    metrics.addGauge("kdd_dicom_associations_accepted", "Associations that have ended, since the beginning.",
                     [this] { return mLog.accepted(); });
    metrics.addGauge("kdd_dicom_associations_rejected",
                     "Associations that were rejected, since the beginning.",
                     [this] { return mLog.rejected(); });
    metrics.addGauge("kdd_dicom_objects_stored", "Objects that were stored, since the beginning.",
                     [this] { return mLog.stored(); });
    metrics.addGauge("kdd_dicom_objects_refused", "Objects that were not stored, since the beginning.",
                     [this] { return mLog.notStored(); });
}

}  // namespace Kdd
