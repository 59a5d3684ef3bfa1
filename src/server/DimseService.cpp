#include "server/DimseService.h"

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

Dimse::Providers makeProviders(ServedArchive& archive, const Dimse::DimseSettings& settings)
{
    const Dimse::RetrieveSource source = {archive.database, *archive.studies, *archive.objects};
    Dimse::Providers providers;
    providers.push_back(std::make_shared<Dimse::EchoProvider>());
    providers.push_back(
        std::make_shared<Dimse::StoreProvider>(*archive.arrivals, settings.rules.takesUnknownClasses));
    providers.push_back(std::make_shared<Dimse::FindProvider>(archive.database, *archive.studies,
                                                              ExResource::dicomAnswers()));
    providers.push_back(std::make_shared<Dimse::MoveProvider>(source, settings.tls, settings.patience));
    providers.push_back(std::make_shared<Dimse::GetProvider>(source));
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
    std::unique_ptr<DimseService> made(new DimseService(audit));
    if (result.good())
        made->mListener =
            Dimse::DimseListener::make(settings, makeProviders(archive, settings), made->mLog, result);
    if (result.good())
        result = made->mLog.check();
    return result.good() ? std::move(made) : nullptr;
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
