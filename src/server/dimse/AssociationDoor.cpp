#include "server/dimse/AssociationDoor.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmnet/assoc.h>
#include <dcmtk/dcmnet/dcmlayer.h>

#include <mutex>

namespace Kdd::Dimse
{
namespace
{

/// What DCMTK is told of the connection is known to the whole process.
std::mutex sTurn;

/// Any number that could be a descriptor: DCMTK then listens nowhere itself.
constexpr int kNoListening = 1;

constexpr int kTimeout = 30;  // [s]; of waits that PeerConnection ends on its own terms

}  // namespace

void EndAssociation::operator()(T_ASC_Association* association) const
{
    ASC_dropAssociation(association);
    ASC_destroyAssociation(&association);
}

class AssociationDoor::Layer : public DcmTransportLayer
{
public:
    /// DCMTK owns it from here on.
    DcmTransportConnection* createConnection(DcmNativeSocketType /*socket*/, OFBool /*isSecure*/) override
    {
        return waiting.release();
    }

    std::unique_ptr<PeerConnection> waiting;
};

std::unique_ptr<AssociationDoor> AssociationDoor::open(Result& result)
{
    const std::lock_guard<std::mutex> lock(sTurn);
    std::unique_ptr<AssociationDoor> made(new AssociationDoor);
    made->mLayer = std::make_unique<Layer>();
    // Names of peers are nothing that anybody shall wait for.
    dcmDisableGethostbyaddr.set(OFTrue);
    dcmExternalSocketHandle.set(kNoListening);
    OFCondition opened = ASC_initializeNetwork(NET_ACCEPTOR, 0, kTimeout, &made->mNetwork);
    dcmExternalSocketHandle.set(-1);
    if (opened.good())
        opened = ASC_setTransportLayer(made->mNetwork, made->mLayer.get(), 0);
    result = opened.good() ? Result() : Result::failure(QString::fromLatin1(opened.text()));
    return opened.good() ? std::move(made) : nullptr;
}

AssociationDoor::~AssociationDoor()
{
    if (mNetwork != nullptr)
        ASC_dropNetwork(&mNetwork);
}

DcmtkAssociation AssociationDoor::enter(std::unique_ptr<PeerConnection> connection, int socket,
                                        quint32 pduSize)
{
    T_ASC_Association* association = nullptr;
    const std::lock_guard<std::mutex> lock(sTurn);
    mLayer->waiting = std::move(connection);
    dcmExternalSocketHandle.set(socket);
    const OFCondition received = ASC_receiveAssociation(mNetwork, &association, static_cast<long>(pduSize));
    dcmExternalSocketHandle.set(-1);
    mLayer->waiting.reset();
    DcmtkAssociation made(association);
    return received.good() ? std::move(made) : nullptr;
}

}  // namespace Kdd::Dimse
