#include "server/http/Client.h"

#include <QProcess>

#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include <stdexcept>

namespace Kdd
{

TlsFiles::TlsFiles()
{
    QProcess openssl;
    openssl.setWorkingDirectory(folder.path());
    openssl.start(QStringLiteral("openssl"),
                  QStringLiteral("req -x509 -newkey ec -pkeyopt ec_paramgen_curve:prime256v1 -nodes -subj "
                                 "/CN=localhost -keyout key.pem -out tls.pem")
                      .split(QLatin1Char(' ')));
    openssl.waitForFinished();
    if (openssl.exitCode() != 0)
        throw std::runtime_error("openssl makes no certificate");
}

QByteArray Reply::header(const char* name) const
{
    const int at = head.indexOf(QByteArray("\r\n") + name + ": ");
    const int start = at + static_cast<int>(qstrlen(name)) + 4;
    return at < 0 ? QByteArray() : head.mid(start, head.indexOf("\r\n", start) - start);
}

Client::Client(const QByteArray& address, Tls tls, int window)
    : mSocket(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0))
{
    sockaddr_in there = {};
    there.sin_family = AF_INET;
    there.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    there.sin_port = htons(address.mid(address.lastIndexOf(':') + 1).toUShort());
    const timeval patience = {60, 0};
    ::setsockopt(mSocket, SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience);
    ::setsockopt(mSocket, SOL_SOCKET, SO_SNDTIMEO, &patience, sizeof patience);
    if (window > 0)
        ::setsockopt(mSocket, SOL_SOCKET, SO_RCVBUF, &window, sizeof window);
    mIsConnected = ::connect(mSocket, reinterpret_cast<sockaddr*>(&there), sizeof there) == 0;
    if (tls == Tls::No)
        return;
    mContext.reset(SSL_CTX_new(TLS_client_method()));
    agree();
}

Client::Client(const QByteArray& address, const TlsFiles* shown,
               const QVector<QPair<QByteArray, QByteArray>>& options)
    : Client(address)
{
    mContext.reset(SSL_CTX_new(TLS_client_method()));
    const std::unique_ptr<SSL_CONF_CTX, void (*)(SSL_CONF_CTX*)> conf(SSL_CONF_CTX_new(), SSL_CONF_CTX_free);
    SSL_CONF_CTX_set_flags(conf.get(), SSL_CONF_FLAG_FILE | SSL_CONF_FLAG_CLIENT);
    SSL_CONF_CTX_set_ssl_ctx(conf.get(), mContext.get());
    for (const auto& option : options)
        if (SSL_CONF_cmd(conf.get(), option.first.constData(), option.second.constData()) <= 0)
            throw std::runtime_error("openssl knows no " + option.first.toStdString());
    if (shown != nullptr) {
        SSL_CTX_use_certificate_chain_file(mContext.get(), shown->certificate().constData());
        SSL_CTX_use_PrivateKey_file(mContext.get(), shown->key().constData(), SSL_FILETYPE_PEM);
    }
    agree();
}

void Client::agree()
{
    mTls.reset(SSL_new(mContext.get()));
    SSL_set_fd(mTls.get(), mSocket);
    mIsConnected = SSL_connect(mTls.get()) == 1;
}

Client::~Client()
{
    ::close(mSocket);
}

void Client::send(const QByteArray& bytes) const
{
    // A server that refuses a request may be gone before all of it is sent.
    if (mTls != nullptr)
        SSL_write(mTls.get(), bytes.constData(), bytes.size());
    else
        (void)!::send(mSocket, bytes.constData(), static_cast<std::size_t>(bytes.size()), MSG_NOSIGNAL);
}

bool Client::receiveMore()
{
    char part[65536];
    const auto count = mTls != nullptr ? SSL_read(mTls.get(), part, sizeof part)
                                       : static_cast<int>(::recv(mSocket, part, sizeof part, 0));
    EXPECT_FALSE(mTls == nullptr && count < 0 && errno == EAGAIN) << "nothing comes";
    if (count > 0)
        mUnread.append(part, count);
    return count > 0;
}

bool Client::receiveUntil(const QByteArray& end)
{
    while (!mUnread.contains(end))
        if (!receiveMore())
            return false;
    return true;
}

QByteArray Client::take(qint64 size)
{
    while (mUnread.size() < size && receiveMore()) {
    }
    const QByteArray taken = mUnread.left(static_cast<int>(size));
    mUnread.remove(0, static_cast<int>(size));
    return taken;
}

void Client::receiveChunks(Reply& reply)
{
    while (receiveUntil("\r\n")) {
        const qint64 size = take(mUnread.indexOf("\r\n") + 2).trimmed().toLongLong(nullptr, 16);
        const QByteArray chunk = take(size + 2);
        reply.isWhole = size == 0 && chunk == "\r\n";
        if (size == 0 || chunk.size() < size + 2)
            return;
        reply.body += chunk.left(static_cast<int>(size));
    }
}

Reply Client::reply(Body body)
{
    Reply reply;
    if (!receiveUntil("\r\n\r\n"))
        return reply;
    reply.head = take(mUnread.indexOf("\r\n\r\n") + 4);
    reply.status = reply.head.mid(9, 3).toInt();
    reply.isWhole = body == Body::StaysBehind || reply.status == 204 || reply.status == 304;
    return reply.isWhole ? reply : bodyAfter(reply);
}

Reply Client::bodyAfter(Reply reply)
{
    reply.isWhole = false;
    const QByteArray length = reply.header("Content-Length");
    if (reply.header("Transfer-Encoding") == "chunked") {
        receiveChunks(reply);
    } else if (!length.isEmpty()) {
        reply.body = take(length.toLongLong());
        reply.isWhole = reply.body.size() == length.toLongLong();
    } else {
        reply.body = rest();
        reply.isWhole = true;
    }
    return reply;
}

QByteArray Client::certificate() const
{
    if (!mIsConnected)
        return {};
    const std::unique_ptr<X509, void (*)(X509*)> shown(SSL_get1_peer_certificate(mTls.get()), X509_free);
    unsigned char* bytes = nullptr;
    const int size = i2d_X509(shown.get(), &bytes);
    const QByteArray copied(reinterpret_cast<const char*>(bytes), qMax(0, size));
    OPENSSL_free(bytes);
    return copied;
}

void Client::reset()
{
    const linger atOnce = {1, 0};
    ::setsockopt(mSocket, SOL_SOCKET, SO_LINGER, &atOnce, sizeof atOnce);
    ::close(mSocket);
    mSocket = -1;
}

QByteArray Client::rest()
{
    while (receiveMore()) {
    }
    return take(mUnread.size());
}

}  // namespace Kdd
