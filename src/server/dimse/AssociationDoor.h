#pragma once

#include "server/dimse/PeerConnection.h"

#include <kddlib/Result.h>

#include <memory>

struct T_ASC_Association;
struct T_ASC_Network;

namespace Kdd::Dimse
{

/// Ends a DCMTK association and its connection.
struct EndAssociation
{
    void operator()(T_ASC_Association* association) const;
};
using DcmtkAssociation = std::unique_ptr<T_ASC_Association, EndAssociation>;

/// Where DCMTK gets connections that were taken elsewhere, and whose requests have come already: it would take them itself, at
/// all addresses of the machine, and have everybody wait for the one whose request comes slowly. May be used on any thread.
class AssociationDoor
{
public:
    /// Null, with the reason, when DCMTK cannot be made ready.
    static std::unique_ptr<AssociationDoor> open(Result& result);
    ~AssociationDoor();

    /// An association that waits for its answer; null when the request cannot be understood. The connection outlives it.
    DcmtkAssociation enter(PeerConnection& connection, quint32 pduSize);

private:
    class Layer;

    AssociationDoor() = default;

    std::unique_ptr<Layer> mLayer;
    T_ASC_Network* mNetwork = nullptr;
};

}  // namespace Kdd::Dimse
