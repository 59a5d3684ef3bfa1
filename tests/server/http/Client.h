#pragma once

#include <QByteArray>
#include <QPair>
#include <QTemporaryDir>
#include <QVector>

#include <openssl/ssl.h>

#include <memory>

namespace Kdd
{

/// A certificate for "localhost" and its key, made anew.
struct TlsFiles
{
    TlsFiles();

    QByteArray certificate() const { return folder.filePath(QStringLiteral("tls.pem")).toLocal8Bit(); }
    QByteArray key() const { return folder.filePath(QStringLiteral("key.pem")).toLocal8Bit(); }

    QTemporaryDir folder;
};

/// An answer as it came.
struct Reply
{
    int status = 0;  ///< 0: the connection ended before it
    QByteArray head;
    QByteArray body;
    bool isWhole = false;  ///< the body came to its end

    /// The value of a header line, empty when it is not there.
    QByteArray header(const char* name) const;
};

/// One connection to a server of this machine, byte by byte. What takes longer than a test may last fails.
class Client
{
public:
    enum class Tls { No, Yes };
    enum class Body { Follows, StaysBehind };

    /// To an address as a server tells it; with a small window, so that little is on its way, when `window` is not 0.
    explicit Client(const QByteArray& address, Tls tls = Tls::No, int window = 0);

    /// Over TLS, with a certificate to show and as far as these options of OpenSSL's commands go: {{"MaxProtocol",
    /// "TLSv1.1"}}.
    Client(const QByteArray& address, const TlsFiles* shown,
           const QVector<QPair<QByteArray, QByteArray>>& options);
    ~Client();
    Client(const Client&) = delete;
    Client& operator=(const Client&) = delete;

    bool isConnected() const { return mIsConnected; }

    void send(const QByteArray& bytes) const;
    void get(const QByteArray& path, const QByteArray& headers = {}) const
    {
        send("GET " + path + " HTTP/1.1\r\nHost: localhost\r\n" + headers + "\r\n");
    }

    /// The next answer.
    Reply reply(Body body = Body::Follows);

    /// The answer to a request of its own.
    Reply ask(const QByteArray& path, const QByteArray& headers = {})
    {
        get(path, headers);
        return reply();
    }

    /// What follows an answer that was received without its body.
    Reply bodyAfter(Reply head);

    /// What the server named itself by, in bytes.
    QByteArray certificate() const;

    /// Ends the connection without a word, what was received and not read included.
    void reset();

    /// The next so many bytes; fewer when the connection ends before.
    QByteArray take(qint64 size);

    /// Everything up to the end of the connection.
    QByteArray rest();

private:
    void agree();
    bool receiveMore();
    bool receiveUntil(const QByteArray& end);
    void receiveChunks(Reply& reply);

    int mSocket;
    bool mIsConnected = false;
    QByteArray mUnread;
    std::unique_ptr<SSL_CTX, void (*)(SSL_CTX*)> mContext{nullptr, SSL_CTX_free};
    std::unique_ptr<SSL, void (*)(SSL*)> mTls{nullptr, SSL_free};
};

}  // namespace Kdd
