#pragma once

#include "server/dimse/RetrieveList.h"
#include "server/dimse/ServiceProvider.h"

namespace Kdd::Dimse
{

/// Answers C-GET: sends objects to who asks, over the same association, in the presentation contexts in which that is the one
/// who takes them.
class GetProvider : public ServiceProvider
{
public:
    /// What the source names outlives the object.
    explicit GetProvider(const RetrieveSource& source)
        : mSource(source)
    {
    }

    bool provides(const QByteArray& sopClass) const override;
    bool sends(const QByteArray& sopClass) const override;
    std::optional<Right> right() const override { return Right::Retrieve; }
    QByteArray chooseTransferSyntax(const QVector<QByteArray>& proposed) const override;
    bool handle(const Command& command, Association& association) override;

private:
    const RetrieveSource mSource;
};

}  // namespace Kdd::Dimse
