#pragma once

#include "server/dimse/ServiceProvider.h"

namespace Kdd::Dimse
{

/// Tells that it is there.
class EchoProvider : public ServiceProvider
{
public:
    bool provides(const QByteArray& sopClass) const override;
    std::optional<Right> right() const override { return std::nullopt; }
    bool handle(const Command& command, Association& association) override;
};

}  // namespace Kdd::Dimse
