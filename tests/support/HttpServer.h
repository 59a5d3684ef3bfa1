#pragma once

#include <QByteArray>
#include <QProcess>
#include <QTemporaryDir>

#include <functional>
#include <map>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

namespace Kdd
{

// Servers on this machine that take requests from their making to their end. What fails throws std::runtime_error.

/// nginx, which serves a temporary folder on a free port, over TLS with a certificate of its own for "localhost".
class NginxServer
{
public:
    enum class Scheme { Http, Https, Http2 };

    /// `directives` go into the server's section.
    explicit NginxServer(Scheme scheme = Scheme::Http, const QByteArray& directives = {});
    ~NginxServer();

    void addFile(const char* name, const QByteArray& content) const;
    std::string url(const std::string& path) const { return mOrigin + path; }
    QByteArray certificateFile() const { return mFolder.filePath(QStringLiteral("tls.pem")).toLocal8Bit(); }

private:
    QTemporaryDir mFolder;
    QProcess mProcess;
    std::string mOrigin;
};

/// The value of a header line of a request; empty when it is not there, or more than once.
QByteArray headerOf(const QByteArray& request, const QByteArray& name);

/// A response as it should be.
QByteArray httpResponse(const QByteArray& body, const QByteArray& code = "200 OK");

/// One that does not say beforehand how long the body is, which comes in chunks or ends with the connection.
constexpr int kEndOfChunks = 7;  // [bytes]
QByteArray chunkedResponse(const QByteArray& body);
QByteArray unmeasuredResponse(const QByteArray& body);

/// Does to a client what no proper server would. Each connection is for one request and has a thread.
class ScriptedServer
{
public:
    /// `bytes`, then `endless` again and again until the client goes, then an orderly end or a reset.
    struct Reply
    {
        QByteArray bytes;
        QByteArray endless = {};
        bool resets = false;
    };

    /// Called with headers and body, on the thread of the connection.
    using Script = std::function<Reply(const QByteArray& request)>;

    explicit ScriptedServer(Script script);

    /// Gives the same bytes to everybody.
    explicit ScriptedServer(const QByteArray& reply)
        : ScriptedServer([reply](const QByteArray& /*request*/) { return Reply{reply}; })
    {
    }
    ~ScriptedServer();

    std::string url(const std::string& path) const { return mOrigin + path; }

    /// Those that came so far.
    std::vector<QByteArray> requests() const;

private:
    void accept();
    void serve(int socket);

    Script mScript;
    std::string mOrigin;
    int mListener;
    mutable std::mutex mMutex;
    std::vector<QByteArray> mRequests;
    std::map<int, std::thread> mConnections;  // by socket
    std::thread mAcceptor;
};

}  // namespace Kdd
