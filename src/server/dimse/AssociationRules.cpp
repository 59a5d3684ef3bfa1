#include "server/dimse/AssociationRules.h"

namespace Kdd::Dimse
{

AssociationRules AssociationRules::open()
{
    AssociationRules rules;
    rules.anyone = kAllRights;
    return rules;
}

const Peer* AssociationRules::find(const QByteArray& title) const
{
    const auto found = peers.constFind(title);
    return found == peers.constEnd() ? nullptr : &*found;
}

Rights AssociationRules::rightsOf(const QByteArray& title, const QByteArray& address) const
{
    const Peer* const peer = find(title);
    if (peer == nullptr)
        return anyone;
    // Whoever calls himself by a peer's name from elsewhere is not even anyone: a name that is known is meant.
    return peer->addresses.isEmpty() || peer->addresses.contains(address) ? peer->rights : Rights();
}

std::shared_ptr<const Kxg::StudyLimits> AssociationRules::studiesOf(const QByteArray& title) const
{
    const Peer* const peer = find(title);
    return peer == nullptr ? nullptr : peer->studies;
}

}  // namespace Kdd::Dimse
