#include "support/HttpServer.h"

#include "support/FileContent.h"

#include <QDir>

#include <arpa/inet.h>
#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <stdexcept>

namespace Kdd
{
namespace
{

/// A socket that listens on a free port of this machine; `origin` is extended by the port and "/".
int listenLocally(std::string& origin)
{
    const int listener = ::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_in address = {};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    auto* const anyAddress = reinterpret_cast<sockaddr*>(&address);
    socklen_t size = sizeof address;
    if (::bind(listener, anyAddress, size) || ::listen(listener, 64) ||
        ::getsockname(listener, anyAddress, &size))
        throw std::runtime_error("No port to listen on");
    origin += std::to_string(ntohs(address.sin_port)) + '/';
    return listener;
}

constexpr char kConfiguration[] = R"(user root root; daemon off; pid pid; error_log log; events {}
http { access_log off; ssl_certificate tls.pem; ssl_certificate_key key.pem;
ssl_protocols TLSv1.2 TLSv1.3; root files;
client_body_temp_path 1; proxy_temp_path 2; fastcgi_temp_path 3; uwsgi_temp_path 4; scgi_temp_path 5;
server { listen 127.0.0.1:%1; %2 } })";

// It inherits the listening socket, so that no other process can take the port and early requests just wait.
constexpr char kStart[] =
    R"(cd "$0" && openssl req -x509 -newkey ec -pkeyopt ec_paramgen_curve:prime256v1 -nodes \
-subj /CN=localhost -addext subjectAltName=DNS:localhost -keyout key.pem -out tls.pem 2> log &&
NGINX="$1;" exec setpriv --pdeathsig TERM nginx -e log -c nginx.conf -p "$0/")";

bool sendAll(int socket, const QByteArray& bytes)
{
    return ::send(socket, bytes.constData(), size_t(bytes.size()), MSG_NOSIGNAL) == bytes.size();
}

bool isWhole(const QByteArray& request)
{
    const int end = request.indexOf("\r\n\r\n");
    return end >= 0 && request.size() - end - 4 >= headerOf(request, "Content-Length").toInt();
}

/// Empty when the client goes before it has sent all.
QByteArray receiveRequest(int socket)
{
    QByteArray request;
    char part[4096];
    while (!isWhole(request)) {
        const auto count = static_cast<int>(::recv(socket, part, sizeof part, 0));
        if (count <= 0)
            return {};
        request.append(part, count);
    }
    return request;
}

}  // namespace

NginxServer::NginxServer(Scheme scheme, const QByteArray& directives)
    : mOrigin(scheme == Scheme::Http ? "http://127.0.0.1:" : "https://localhost:")
{
    const size_t portStart = mOrigin.size();
    const int listener = listenLocally(mOrigin);
    QByteArray listen = QByteArray::fromStdString(mOrigin.substr(portStart)).chopped(1);
    listen += scheme == Scheme::Http ? "" : scheme == Scheme::Https ? " ssl" : " ssl http2";
    QDir(mFolder.path()).mkdir(QStringLiteral("files"));
    addFile("../nginx.conf", QByteArray(kConfiguration).replace("%1", listen).replace("%2", directives));

    ::fcntl(listener, F_SETFD, 0);
    mProcess.setProcessChannelMode(QProcess::ForwardedErrorChannel);
    mProcess.start(QStringLiteral("sh"), {QStringLiteral("-c"), QString::fromLatin1(kStart), mFolder.path(),
                                          QString::number(listener)});
    mProcess.waitForStarted();
    ::close(listener);
}

NginxServer::~NginxServer()
{
    mProcess.terminate();
    mProcess.waitForFinished();
}

void NginxServer::addFile(const char* name, const QByteArray& content) const
{
    putFile(mFolder.filePath(QStringLiteral("files/") + QString::fromLatin1(name)), content);
}

QByteArray headerOf(const QByteArray& request, const QByteArray& name)
{
    const QByteArray headers = request.left(request.indexOf("\r\n\r\n") + 2);
    const int at = headers.indexOf("\r\n" + name + ": ");
    const int start = at + name.size() + 4;
    const bool isOne = at >= 0 && headers.indexOf("\r\n" + name + ":", start) < 0;
    return isOne ? headers.mid(start, headers.indexOf('\r', start) - start) : QByteArray();
}

QByteArray httpResponse(const QByteArray& body, const QByteArray& code)
{
    return "HTTP/1.1 " + code + "\r\nContent-Length: " + QByteArray::number(body.size()) + "\r\n\r\n" + body;
}

QByteArray chunkedResponse(const QByteArray& body)
{
    return "HTTP/1.1 200 OK\r\nETag: \"a\"\r\nTransfer-Encoding: chunked\r\n\r\n" +
           QByteArray::number(body.size(), 16) + "\r\n" + body + "\r\n0\r\n\r\n";
}

QByteArray unmeasuredResponse(const QByteArray& body)
{
    return "HTTP/1.1 200 OK\r\nETag: \"a\"\r\nConnection: close\r\n\r\n" + body;
}

ScriptedServer::ScriptedServer(Script script)
    : mScript(std::move(script))
    , mOrigin("http://127.0.0.1:")
    , mListener(listenLocally(mOrigin))
    , mAcceptor([this] { accept(); })
{
}

ScriptedServer::~ScriptedServer()
{
    ::shutdown(mListener, SHUT_RDWR);
    mAcceptor.join();
    for (auto& [socket, thread] : mConnections) {
        ::shutdown(socket, SHUT_RDWR);
        thread.join();
        ::close(socket);
    }
    ::close(mListener);
}

std::vector<QByteArray> ScriptedServer::requests() const
{
    const std::lock_guard lock(mMutex);
    return mRequests;
}

void ScriptedServer::accept()
{
    for (int socket = 0; (socket = ::accept4(mListener, nullptr, nullptr, SOCK_CLOEXEC)) >= 0;)
        mConnections.emplace(socket, [this, socket] { serve(socket); });
}

void ScriptedServer::serve(int socket)
{
    const QByteArray request = receiveRequest(socket);
    const Reply reply = request.isEmpty() ? Reply() : mScript(request);
    std::unique_lock lock(mMutex);
    mRequests.push_back(request);
    lock.unlock();
    bool open = sendAll(socket, reply.bytes);
    while (open && !reply.endless.isEmpty())
        open = sendAll(socket, reply.endless);
    // The number of the socket stays taken until the end. To connect it to nobody is a reset.
    sockaddr nobody = {};
    if (reply.resets)
        ::connect(socket, &nobody, sizeof nobody);
    else
        ::shutdown(socket, SHUT_RDWR);
}

}  // namespace Kdd
