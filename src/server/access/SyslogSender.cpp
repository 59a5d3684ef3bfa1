#include "server/access/SyslogSender.h"

#include <kddlib/LogFile.h>
#include <netdb.h>
#include <openssl/err.h>
#include <openssl/ssl.h>
#include <openssl/x509v3.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstring>
#include <memory>

namespace Kdd::Access
{
namespace
{

/// Some kilobyte each. An archive that is asked for hundreds of studies a second fills it in a minute.
constexpr std::size_t kMostWaiting = 10000;

constexpr auto kPause = std::chrono::seconds(5);     // before a receiver that failed is tried again
constexpr auto kFarewell = std::chrono::seconds(3);  // at the end of the process
constexpr timeval kPatience = {5, 0};                // for one step with the receiver
constexpr timeval kGlance = {0, 10000};              // for what it may have said

struct Release
{
    void operator()(SSL* tls) const { SSL_free(tls); }
    void operator()(SSL_CTX* context) const { SSL_CTX_free(context); }
    void operator()(addrinfo* found) const { ::freeaddrinfo(found); }
};

QString systemReason()
{
    return QString::fromLocal8Bit(std::strerror(errno));
}

QString tlsReason()
{
    char text[256] = "";
    const unsigned long code = ERR_get_error();
    if (code == 0)
        return QStringLiteral("TLS failed");
    ERR_error_string_n(code, text, sizeof text);
    ERR_clear_error();
    return QString::fromLatin1(text);
}

}  // namespace

/// The way to the receiver.
class SyslogSender::Line
{
public:
    explicit Line(const SyslogRules& rules)
        : mRules(rules)
    {
    }
    ~Line() { close(); }
    Line(const Line&) = delete;
    Line& operator=(const Line&) = delete;

    bool send(const QByteArray& message, QString& reason)
    {
        // What is written to a connection that the other side has ended is lost without a word.
        if (mTls != nullptr && hasEnded())
            close();
        if (mSocket < 0 && !open(reason)) {
            close();
            return false;
        }
        if (mTls == nullptr) {
            const bool isSent = ::send(mSocket, message.constData(), static_cast<std::size_t>(message.size()),
                                       MSG_NOSIGNAL) == message.size();
            // A message that no datagram holds will not get there by waiting.
            if (isSent || errno == EMSGSIZE)
                return true;
            reason = systemReason();
            close();
            return false;
        }
        const QByteArray framed = QByteArray::number(message.size()) + ' ' + message;
        if (SSL_write(mTls.get(), framed.constData(), framed.size()) == framed.size())
            return true;
        reason = tlsReason();
        close();
        return false;
    }

private:
    bool open(QString& reason)
    {
        return mRules.by == SyslogRules::By::Socket
                   ? openPath(reason)
                   : openHost(reason) && (mRules.by != SyslogRules::By::Tls || agree(reason));
    }

    bool openPath(QString& reason)
    {
        sockaddr_un address = {};
        address.sun_family = AF_UNIX;
        reason = QStringLiteral("the name of the socket is too long");
        if (mRules.host.size() >= static_cast<int>(sizeof address.sun_path))
            return false;
        std::memcpy(address.sun_path, mRules.host.constData(), static_cast<std::size_t>(mRules.host.size()));
        mSocket = ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
        setPatience(kPatience);
        if (mSocket >= 0 &&
            ::connect(mSocket, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0)
            return true;
        reason = systemReason();
        return false;
    }

    bool openHost(QString& reason)
    {
        const bool isTls = mRules.by == SyslogRules::By::Tls;
        addrinfo hints = {};
        addrinfo* list = nullptr;
        hints.ai_socktype = isTls ? SOCK_STREAM : SOCK_DGRAM;
        const int fault = ::getaddrinfo(mRules.host.constData(), mRules.port.constData(), &hints, &list);
        const std::unique_ptr<addrinfo, Release> found(list);
        if (fault != 0) {
            reason = QString::fromLocal8Bit(::gai_strerror(fault));
            return false;
        }
        for (const addrinfo* each = list; each != nullptr; each = each->ai_next) {
            close();
            mSocket = ::socket(each->ai_family, each->ai_socktype | SOCK_CLOEXEC, each->ai_protocol);
            setPatience(kPatience);
            if (mSocket >= 0 && ::connect(mSocket, each->ai_addr, each->ai_addrlen) == 0)
                return true;
            reason = systemReason();
        }
        return false;
    }

    bool agree(QString& reason)
    {
        const std::unique_ptr<SSL_CTX, Release> context(SSL_CTX_new(TLS_client_method()));
        const bool isKnown =
            context != nullptr && SSL_CTX_set_min_proto_version(context.get(), TLS1_2_VERSION) == 1 &&
            (mRules.caFile.isEmpty()
                 ? SSL_CTX_set_default_verify_paths(context.get())
                 : SSL_CTX_load_verify_locations(context.get(), mRules.caFile.constData(), nullptr)) == 1;
        if (isKnown) {
            SSL_CTX_set_verify(context.get(), SSL_VERIFY_PEER, nullptr);
            mTls.reset(SSL_new(context.get()));
        }
        const bool isAgreed = mTls != nullptr && nameReceiver() && SSL_set_fd(mTls.get(), mSocket) == 1 &&
                              SSL_connect(mTls.get()) == 1;
        if (!isAgreed)
            reason = tlsReason();
        return isAgreed;
    }

    /// Whose certificate it has to be.
    bool nameReceiver()
    {
        X509_VERIFY_PARAM* const wanted = SSL_get0_param(mTls.get());
        if (X509_VERIFY_PARAM_set1_ip_asc(wanted, mRules.host.constData()) == 1)
            return true;
        ERR_clear_error();
        return SSL_set_tlsext_host_name(mTls.get(), mRules.host.constData()) == 1 &&
               X509_VERIFY_PARAM_set1_host(wanted, mRules.host.constData(), 0) == 1;
    }

    bool hasEnded()
    {
        pollfd socket = {mSocket, POLLIN, 0};
        if (::poll(&socket, 1, 0) <= 0)
            return false;
        char said[256];
        setPatience(kGlance);
        const int count = SSL_read(mTls.get(), said, sizeof said);
        const bool isOpen = count > 0 || SSL_get_error(mTls.get(), count) == SSL_ERROR_WANT_READ;
        setPatience(kPatience);
        ERR_clear_error();
        return !isOpen;
    }

    void setPatience(const timeval& time) const
    {
        ::setsockopt(mSocket, SOL_SOCKET, SO_SNDTIMEO, &kPatience, sizeof kPatience);
        ::setsockopt(mSocket, SOL_SOCKET, SO_RCVTIMEO, &time, sizeof time);
    }

    void close()
    {
        mTls.reset();
        if (mSocket >= 0)
            ::close(mSocket);
        mSocket = -1;
    }

    const SyslogRules& mRules;
    int mSocket = -1;
    std::unique_ptr<SSL, Release> mTls;
};

SyslogSender::SyslogSender(const SyslogRules& rules)
    : mRules(rules)
    , mThread([this] { run(); })
{
}

SyslogSender::~SyslogSender()
{
    {
        const std::lock_guard<std::mutex> lock(mMutex);
        mEnds = true;
    }
    mChanged.notify_all();
    mThread.join();
}

void SyslogSender::send(const QByteArray& message)
{
    const std::lock_guard<std::mutex> lock(mMutex);
    if (mWaiting.size() >= kMostWaiting) {
        ++mLost;
        return;
    }
    mWaiting.push_back(message);
    mChanged.notify_all();
}

bool SyslogSender::waitForWork(std::unique_lock<std::mutex>& lock)
{
    mChanged.wait(lock, [this] { return mEnds || !mWaiting.empty(); });
    return !mWaiting.empty();
}

/// Told once and not with every message. With the lock held.
void SyslogSender::note(bool isSent, const QString& reason)
{
    if (isSent != mIsBroken)
        return;
    mIsBroken = !isSent;
    if (!isSent) {
        LogFile::errorf("Audit messages do not reach %s: %s", mRules.host.constData(),
                        qUtf8Printable(reason));
        return;
    }
    LogFile::warnf("Audit messages reach %s again; %lld were lost", mRules.host.constData(),
                   static_cast<long long>(mLost));
    mLost = 0;
}

void SyslogSender::run()
{
    // The library writes to connections that have ended.
    sigset_t pipe;
    sigemptyset(&pipe);
    sigaddset(&pipe, SIGPIPE);
    ::pthread_sigmask(SIG_BLOCK, &pipe, nullptr);
    Line line(mRules);
    std::unique_lock<std::mutex> lock(mMutex);
    std::chrono::steady_clock::time_point end;
    while (waitForWork(lock)) {
        if (mEnds && end.time_since_epoch().count() == 0)
            end = std::chrono::steady_clock::now() + kFarewell;
        const QByteArray message = mWaiting.front();
        QString reason;
        lock.unlock();
        const bool isSent = line.send(message, reason) || line.send(message, reason);
        lock.lock();
        note(isSent, reason);
        if (isSent)
            mWaiting.pop_front();
        else if (!mEnds)
            mChanged.wait_for(lock, kPause, [this] { return mEnds; });
        if (mEnds &&
            (!isSent || (end.time_since_epoch().count() != 0 && std::chrono::steady_clock::now() > end)))
            break;
    }
    mLost += static_cast<qint64>(mWaiting.size());
    if (mLost > 0)
        LogFile::errorf("%lld audit messages were lost", static_cast<long long>(mLost));
}

}  // namespace Kdd::Access
