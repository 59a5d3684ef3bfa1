#pragma once

#include "server/dimse/DimseSettings.h"
#include "server/dimse/RetrieveList.h"
#include "server/dimse/ServiceProvider.h"

namespace Kdd::Dimse
{

/// Answers C-MOVE: sends objects to application entities that the rules know by where they are called.
class MoveProvider : public ServiceProvider
{
public:
    /// What the source names outlives the object.
    MoveProvider(const RetrieveSource& source, std::optional<TlsRules> tls, std::chrono::seconds patience);

    bool provides(const QByteArray& sopClass) const override;
    std::optional<Right> right() const override { return Right::Retrieve; }
    bool handle(const Command& command, Association& association) override;

private:
    const RetrieveSource mSource;
    const std::optional<TlsRules> mTls;
    const std::chrono::seconds mPatience;
};

}  // namespace Kdd::Dimse
