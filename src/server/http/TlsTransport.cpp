#include "server/http/TlsTransport.h"

#include <QFile>

#include <openssl/err.h>
#include <openssl/ssl.h>
#include <sys/socket.h>

#include <algorithm>

namespace Kdd::Http
{
namespace
{

struct Free
{
    void operator()(SSL_CTX* context) const { SSL_CTX_free(context); }
    void operator()(SSL* connection) const { SSL_free(connection); }
    void operator()(X509* certificate) const { X509_free(certificate); }
    void operator()(BIO* text) const { BIO_free(text); }
};

/// The first of the library's reasons, which is where the others come from.
Result failureOf(const QByteArray& file)
{
    const unsigned long code = ERR_get_error();
    char text[256] = "it cannot be used";
    if (code != 0)
        ERR_error_string_n(code, text, sizeof text);
    // What another thread or connection left behind must not be taken for the next one's reason.
    ERR_clear_error();
    return Result::failure(QString::fromLocal8Bit(text)).within(QFile::decodeName(file));
}

QByteArray nameOfPeer(SSL* connection)
{
    const std::unique_ptr<X509, Free> certificate(SSL_get1_peer_certificate(connection));
    const std::unique_ptr<BIO, Free> text(BIO_new(BIO_s_mem()));
    char* bytes = nullptr;
    if (certificate == nullptr || text == nullptr || SSL_get_verify_result(connection) != X509_V_OK ||
        X509_NAME_print_ex(text.get(), X509_get_subject_name(certificate.get()), 0,
                           XN_FLAG_RFC2253 & ~ASN1_STRFLGS_ESC_MSB) < 0)
        return {};
    const long size = BIO_get_mem_data(text.get(), &bytes);
    return {bytes, static_cast<int>(size)};
}

class TlsTransport : public Transport
{
public:
    TlsTransport(SSL* connection, int socket)
        : mConnection(connection)
        , mSocket(socket)
    {
        SSL_set_fd(connection, socket);
        SSL_set_accept_state(connection);
    }

    Outcome begin() override
    {
        ERR_clear_error();
        const Outcome outcome = outcomeOf(SSL_do_handshake(mConnection.get()));
        if (outcome == Outcome::Done)
            mPeerName = nameOfPeer(mConnection.get());
        return outcome;
    }

    Outcome read(char* to, int size, int& count) override
    {
        ERR_clear_error();
        std::size_t got = 0;
        const Outcome outcome =
            outcomeOf(SSL_read_ex(mConnection.get(), to, static_cast<std::size_t>(size), &got));
        count = static_cast<int>(got);
        return outcome;
    }

    bool hasUnread() const override { return SSL_pending(mConnection.get()) > 0; }

    Outcome write(const char* from, qint64 size, More /*more*/, qint64& count) override
    {
        ERR_clear_error();
        std::size_t sent = 0;
        const Outcome outcome =
            outcomeOf(SSL_write_ex(mConnection.get(), from, static_cast<std::size_t>(size), &sent));
        count = static_cast<qint64>(sent);
        return outcome;
    }

    void endWriting() override
    {
        ERR_clear_error();
        SSL_shutdown(mConnection.get());
        ::shutdown(mSocket, SHUT_WR);
    }

    const char* scheme() const override { return "https"; }

    QByteArray peerName() const override { return mPeerName; }

private:
    Outcome outcomeOf(int answer) const
    {
        if (answer > 0)
            return Outcome::Done;
        switch (SSL_get_error(mConnection.get(), answer)) {
        case SSL_ERROR_WANT_READ:
            return Outcome::WantsRead;
        case SSL_ERROR_WANT_WRITE:
            return Outcome::WantsWrite;
        case SSL_ERROR_ZERO_RETURN:
            return Outcome::Ended;
        default:
            return Outcome::Failed;
        }
    }

    std::unique_ptr<SSL, Free> mConnection;
    int mSocket;
    QByteArray mPeerName;
};

/// Clients need not show a certificate; one that cannot be trusted ends the handshake.
bool trustClients(SSL_CTX* context, const QByteArray& caFile)
{
    static constexpr unsigned char kSessions[] = "kdd";
    if (SSL_CTX_load_verify_locations(context, caFile.constData(), nullptr) != 1)
        return false;
    SSL_CTX_set_client_CA_list(context, SSL_load_client_CA_file(caFile.constData()));
    SSL_CTX_set_verify(context, SSL_VERIFY_PEER, nullptr);
    // Without it no session that began with a certificate could be taken up again.
    return SSL_CTX_set_session_id_context(context, kSessions, sizeof kSessions - 1) == 1;
}

/// What every client of the last ten years speaks: keys that nobody can find afterwards, and no cipher without a seal.
/// TLS 1.3 has no other ones.
constexpr const char* kCiphers = "ECDHE+AESGCM:ECDHE+CHACHA20";

/// That may be taken up again, with some kilobyte each.
constexpr long kMostSessions = 2000;

}  // namespace

struct TlsContext::Private
{
    std::unique_ptr<SSL_CTX, Free> context{SSL_CTX_new(TLS_server_method())};
};

TlsContext::TlsContext()
    : d(std::make_unique<Private>())
{
}

TlsContext::~TlsContext() = default;

std::unique_ptr<TlsContext> TlsContext::make(const QByteArray& certificateFile, const QByteArray& keyFile,
                                             const QByteArray& clientCaFile, Result& result)
{
    std::unique_ptr<TlsContext> made(new TlsContext);
    SSL_CTX* const context = made->d->context.get();
    ERR_clear_error();
    result = {};
    if (context == nullptr)
        result = failureOf("TLS");
    else if (SSL_CTX_use_certificate_chain_file(context, certificateFile.constData()) != 1)
        result = failureOf(certificateFile);
    else if (SSL_CTX_use_PrivateKey_file(context, keyFile.constData(), SSL_FILETYPE_PEM) != 1 ||
             SSL_CTX_check_private_key(context) != 1)
        result = failureOf(keyFile);
    else if (!clientCaFile.isEmpty() && !trustClients(context, clientCaFile))
        result = failureOf(clientCaFile);
    else if (SSL_CTX_set_cipher_list(context, kCiphers) != 1)
        result = failureOf("TLS");
    if (result.bad())
        return nullptr;
    SSL_CTX_set_min_proto_version(context, TLS1_2_VERSION);
    // Connections that rest give their buffers back. Writes go on with what did not fit, from wherever it lies then.
    SSL_CTX_set_mode(context, SSL_MODE_RELEASE_BUFFERS | SSL_MODE_ENABLE_PARTIAL_WRITE |
                                  SSL_MODE_ACCEPT_MOVING_WRITE_BUFFER);
    // Sessions that are taken up again are kept here and not in tickets of the client: one key would open all of those, for as
    // long as the process lives, with what was said in them.
    SSL_CTX_set_options(context, SSL_OP_NO_RENEGOTIATION | SSL_OP_NO_COMPRESSION | SSL_OP_NO_TICKET);
    SSL_CTX_sess_set_cache_size(context, kMostSessions);
    return made;
}

std::unique_ptr<Transport> TlsContext::accept(int socket)
{
    return std::make_unique<TlsTransport>(SSL_new(d->context.get()), socket);
}

}  // namespace Kdd::Http
