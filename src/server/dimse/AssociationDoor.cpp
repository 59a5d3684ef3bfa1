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

/// What DCMTK has of a connection: it deletes it as soon as it takes it for closed.
class Handle : public DcmTransportConnection
{
public:
    explicit Handle(PeerConnection& connection)
        : DcmTransportConnection(connection.socket())
        , mConnection(connection)
    {
    }
    ~Handle() override { mConnection.close(); }

    OFCondition serverSideHandshake() override { return EC_Normal; }
    OFCondition clientSideHandshake() override { return EC_IllegalCall; }
    OFCondition renegotiate(const char* /*newSuite*/) override { return EC_IllegalCall; }
    ssize_t read(void* to, size_t size) override
    {
        return mConnection.read(static_cast<char*>(to), static_cast<qint64>(size));
    }
    ssize_t write(void* from, size_t size) override
    {
        // No interruption, after which DCMTK would come again.
        errno = EPIPE;
        const bool isWritten = mConnection.write(static_cast<const char*>(from), static_cast<qint64>(size));
        return isWritten ? static_cast<ssize_t>(size) : -1;
    }
    void close() override { mConnection.close(); }
    void closeTransportConnection() override { mConnection.close(); }
    unsigned long getPeerCertificateLength() override { return 0; }
    unsigned long getPeerCertificate(void* /*to*/, unsigned long /*size*/) override { return 0; }
    OFBool networkDataAvailable(int timeout) override
    {
        return mConnection.hasData(std::chrono::seconds(std::max(timeout, 0)));
    }
    OFBool isTransparentConnection() override { return OFFalse; }
    OFString& dumpConnectionParameters(OFString& text) override { return text; }

private:
    PeerConnection& mConnection;
};

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

    std::unique_ptr<Handle> waiting;
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

DcmtkAssociation AssociationDoor::enter(PeerConnection& connection, quint32 pduSize)
{
    T_ASC_Association* association = nullptr;
    const std::lock_guard<std::mutex> lock(sTurn);
    mLayer->waiting = std::make_unique<Handle>(connection);
    dcmExternalSocketHandle.set(connection.socket());
    const OFCondition received = ASC_receiveAssociation(mNetwork, &association, static_cast<long>(pduSize));
    dcmExternalSocketHandle.set(-1);
    mLayer->waiting.reset();
    DcmtkAssociation made(association);
    return received.good() ? std::move(made) : nullptr;
}

}  // namespace Kdd::Dimse
