#include "server/dimse/OutgoingAssociation.h"

#include "server/dicomweb/MediaTypes.h"

#include <dcmtk/dcmdata/dctk.h>
#include <dcmtk/dcmdata/dcxfer.h>
#include <dcmtk/dcmnet/dcmlayer.h>
#include <dcmtk/dcmnet/dcmtrans.h>
#include <dcmtk/dcmtls/tlslayer.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <openssl/ssl.h>
#include <sys/socket.h>

#include <algorithm>
#include <cstring>
#include <functional>

namespace Kdd::Dimse
{
namespace
{

using namespace DicomWeb;

/// Contexts have odd numbers of one byte.
constexpr std::size_t kMostContexts = 128;

/// Of a name by which a host is called, as DCMTK has room for it together with the port [bytes].
constexpr int kLongestHost = 100;

const QVector<QByteArray> kPlain = {kExplicitLittleEndian, kImplicitLittleEndian};

bool isCompressed(const QByteArray& syntax)
{
    return DcmXfer(syntax.constData()).isEncapsulated();
}

/// In which a file may be whose syntax the tag file could not tell, because DCMTK has no number for it.
const QVector<QByteArray>& unnumberedSyntaxes()
{
    static const QVector<QByteArray> syntaxes = [] {
        QVector<QByteArray> made;
        for (const SyntaxMedia& row : syntaxMedia()) {
            if (DcmXfer(row.uid).getXfer() == EXS_Unknown)
                made.append(row.uid);
        }
        return made;
    }();
    return syntaxes;
}

QVector<QByteArray> compressedSyntaxesOf(const RetrieveItem& item)
{
    if (item.storedSyntax.isEmpty())
        return unnumberedSyntaxes();
    return isCompressed(item.storedSyntax) ? QVector<QByteArray>{item.storedSyntax} : QVector<QByteArray>();
}

bool holds(const std::vector<ProposedContext>& proposals, const QByteArray& sopClass,
           const QVector<QByteArray>& syntaxes)
{
    return std::any_of(proposals.begin(), proposals.end(), [&](const ProposedContext& each) {
        return each.sopClass == sopClass && each.syntaxes == syntaxes;
    });
}

Result failure(const char* what, const OFCondition& condition)
{
    return Result::failure(
        QStringLiteral("%1: %2").arg(QLatin1String(what), QString::fromLatin1(condition.text())));
}

void setOption(int socket, int option)
{
    const int yes = 1;
    ::setsockopt(socket, IPPROTO_TCP, option, &yes, sizeof yes);
}

/// Of the many small messages none waits for another: neither ours until the last one was acknowledged, nor those of the
/// other side until we acknowledge their heads.
class PromptConnection : public DcmTCPConnection
{
public:
    explicit PromptConnection(DcmNativeSocketType socket)
        : DcmTCPConnection(socket)
    {
    }

    ssize_t read(void* to, size_t size) override
    {
        setOption(getSocket(), TCP_QUICKACK);
        return DcmTCPConnection::read(to, size);
    }

    OFBool networkDataAvailable(int timeout) override
    {
        setOption(getSocket(), TCP_QUICKACK);
        return DcmTCPConnection::networkDataAvailable(timeout);
    }
};

/// Tells of the socket as soon as there is one.
using Connected = std::function<void(int socket)>;

class PromptLayer : public DcmTransportLayer
{
public:
    explicit PromptLayer(Connected connected)
        : mConnected(std::move(connected))
    {
    }

    DcmTransportConnection* createConnection(DcmNativeSocketType socket, OFBool isSecure) override
    {
        if (isSecure)
            return nullptr;
        setOption(socket, TCP_NODELAY);
        mConnected(socket);
        return new PromptConnection(socket);
    }

private:
    const Connected mConnected;
};

class SecureLayer : public DcmTLSTransportLayer
{
public:
    explicit SecureLayer(Connected connected)
        : DcmTLSTransportLayer(NET_REQUESTOR, nullptr, OFFalse)
        , mConnected(std::move(connected))
    {
    }

    /// Null when it cannot be spoken.
    static std::unique_ptr<SecureLayer> make(const TlsRules& rules, const Connected& connected,
                                             Result& result)
    {
        auto layer = std::make_unique<SecureLayer>(connected);
        OFCondition condition = layer->setTLSProfile(TSP_Profile_BCP195_ND);
        if (condition.good())
            condition = layer->activateCipherSuites();
        if (condition.good())
            condition = layer->setPrivateKeyFile(rules.keyFile.constData(), DCF_Filetype_PEM);
        if (condition.good())
            condition = layer->addTrustedCertificateFile(rules.caFile.constData(), DCF_Filetype_PEM);
        layer->setCertificateVerification(DCV_requireCertificate);
        if (condition.bad())
            result = failure("TLS cannot be spoken", condition);
        // DCMTK's own way loses a key each time, and takes no chain.
        else if (SSL_CTX_use_certificate_chain_file(layer->getNativeHandle(),
                                                    rules.certificateFile.constData()) != 1)
            result =
                Result::failure(QStringLiteral("TLS cannot be spoken: this is no certificate of the key"))
                    .within(QString::fromUtf8(rules.certificateFile));
        return result.good() ? std::move(layer) : nullptr;
    }

    DcmTransportConnection* createConnection(DcmNativeSocketType socket, OFBool isSecure) override
    {
        setOption(socket, TCP_NODELAY);
        mConnected(socket);
        return DcmTLSTransportLayer::createConnection(socket, isSecure);
    }

private:
    const Connected mConnected;
};

Result addContexts(T_ASC_Parameters& parameters, const std::vector<ProposedContext>& proposals)
{
    int id = 1;
    for (const ProposedContext& each : proposals) {
        std::vector<const char*> syntaxes;
        for (const QByteArray& syntax : each.syntaxes)
            syntaxes.push_back(syntax.constData());
        const OFCondition added = ASC_addPresentationContext(
            &parameters, static_cast<T_ASC_PresentationContextID>(id), each.sopClass.constData(),
            syntaxes.data(), static_cast<int>(syntaxes.size()),
            each.isProvided ? ASC_SC_ROLE_SCP : ASC_SC_ROLE_DEFAULT);
        if (added.bad())
            return failure("A class cannot be proposed", added);
        id += 2;
    }
    return {};
}

}  // namespace

std::vector<ProposedContext> proposalsFor(const std::vector<RetrieveItem>& items, std::size_t index)
{
    std::vector<ProposedContext> proposals;
    for (; index < items.size(); ++index) {
        const RetrieveItem& item = items[index];
        std::vector<ProposedContext> more;
        if (!holds(proposals, item.sopClass, kPlain))
            more.push_back({item.sopClass, kPlain});
        for (const QByteArray& syntax : compressedSyntaxesOf(item)) {
            if (!holds(proposals, item.sopClass, {syntax}))
                more.push_back({item.sopClass, {syntax}});
        }
        if (proposals.size() + more.size() > kMostContexts)
            break;
        proposals.insert(proposals.end(), more.begin(), more.end());
    }
    return proposals;
}

bool isProposed(const std::vector<ProposedContext>& proposals, const RetrieveItem& item)
{
    const QVector<QByteArray> syntaxes = compressedSyntaxesOf(item);
    return holds(proposals, item.sopClass, kPlain) &&
           std::all_of(syntaxes.begin(), syntaxes.end(),
                       [&](const QByteArray& syntax) { return holds(proposals, item.sopClass, {syntax}); });
}

std::unique_ptr<OutgoingAssociation> OutgoingAssociation::open(const Parties& parties,
                                                               const std::vector<ProposedContext>& proposals,
                                                               BreakSwitch& breakSwitch, Result& result)
{
    std::unique_ptr<OutgoingAssociation> made(new OutgoingAssociation);
    made->mPatience = parties.patience;
    result = made->request(parties, proposals, breakSwitch);
    return result.good() ? std::move(made) : nullptr;
}

Result OutgoingAssociation::request(const Parties& parties, const std::vector<ProposedContext>& proposals,
                                    BreakSwitch& breakSwitch)
{
    Result result;
    const auto connected = [&](int socket) {
        mSocket = std::make_unique<BreakableSocket>(breakSwitch, socket);
    };
    if (breakSwitch.isBroken())
        return Result::failure(QStringLiteral("The server stops"));
    if (parties.peer.host.size() > kLongestHost)
        return Result::failure(QStringLiteral("The name of its host is too long"));
    const auto seconds = static_cast<int>(mPatience.count());
    OFCondition condition = ASC_initializeNetwork(NET_REQUESTOR, 0, seconds, &mNetwork);
    if (condition.bad())
        return failure("DCMTK cannot be made ready", condition);
    if (parties.tls) {
        std::unique_ptr<SecureLayer> layer = SecureLayer::make(*parties.tls, connected, result);
        if (layer == nullptr)
            return result;
        ASC_setTransportLayer(mNetwork, layer.release(), 1);
    } else {
        ASC_setTransportLayer(mNetwork, new PromptLayer(connected), 1);
    }
    T_ASC_Parameters* parameters = nullptr;
    condition = ASC_createAssociationParameters(&parameters, ASC_DEFAULTMAXPDU);
    if (condition.bad())
        return failure("DCMTK cannot be made ready", condition);
    const QByteArray address = parties.peer.host + ':' + QByteArray::number(parties.peer.port);
    ASC_setAPTitles(parameters, parties.ownTitle.constData(), parties.title.constData(), nullptr);
    ASC_setPresentationAddresses(parameters, "localhost", address.constData());
    ASC_setTransportLayerType(parameters, parties.tls ? OFTrue : OFFalse);
    result = addContexts(*parameters, proposals);
    if (result.bad()) {
        ASC_destroyAssociationParameters(&parameters);
        return result;
    }
    mIsBroken = true;
    condition =
        ASC_requestAssociation(mNetwork, parameters, &mAssociation, nullptr, nullptr, DUL_NOBLOCK, seconds);
    if (condition.good()) {
        mIsBroken = false;
        return {};
    }
    // The association has the parameters where there is one.
    if (mAssociation == nullptr)
        ASC_destroyAssociationParameters(&parameters);
    return failure("It gives no association", condition);
}

OutgoingAssociation::~OutgoingAssociation()
{
    if (mAssociation != nullptr) {
        if (!mIsBroken)
            mIsBroken = ASC_releaseAssociation(mAssociation).bad();
        if (mIsBroken)
            ASC_abortAssociation(mAssociation);
        ASC_destroyAssociation(&mAssociation);
    }
    if (mNetwork != nullptr)
        ASC_dropNetwork(&mNetwork);
}

std::vector<SendContext> OutgoingAssociation::contexts() const
{
    std::vector<SendContext> contexts;
    const int count = ASC_countPresentationContexts(mAssociation->params);
    for (int i = 0; i < count; ++i) {
        T_ASC_PresentationContext each = {};
        if (ASC_getPresentationContext(mAssociation->params, i, &each).good() &&
            each.resultReason == ASC_P_ACCEPTANCE)
            contexts.push_back(
                {each.presentationContextID, each.abstractSyntax, each.acceptedTransferSyntax});
    }
    return contexts;
}

bool OutgoingAssociation::receive(T_DIMSE_Message& message)
{
    T_ASC_PresentationContextID id = 0;
    DcmDataset* detail = nullptr;
    const OFCondition came = DIMSE_receiveCommand(
        mAssociation, DIMSE_NONBLOCKING, static_cast<int>(mPatience.count()), &id, &message, &detail);
    delete detail;
    return came.good();
}

}  // namespace Kdd::Dimse
