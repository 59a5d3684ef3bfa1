#pragma once

#include "platform/base/Export.h"
#include "platform/base/Result.h"

#include <QByteArray>

#include <chrono>
#include <string>
#include <vector>

class QJsonDocument;
class QJsonObject;

namespace Kdd
{

class KxCurlDownloadStream;
class KxCurlUploadStream;
struct KxHttpStatus;

/// The one way by which the library reads and writes over HTTP and HTTPS.
///
/// It keeps what all requests have in common: settings, idle handles, and the caches that spare a request the search
/// for the server, the connection and the handshake. An address is a URL of HTTP or HTTPS, to which the session's id
/// is added, or "gs:" and any number of "/", bucket, "/", object, which goes to the cloud storage.
///
/// A copy acts on the same state. Any thread may use it. Settings may be changed at any time and hold for requests
/// that begin afterwards. Certificates are checked only when the site's settings ask for it (KDD_TLS_VERIFY).
///
/// Names of objects and paths are escaped where an address could not hold them (`#`, blanks, control characters, bytes
/// beyond ASCII); "%" and "?" stay, so that escaped names and queries can be handed over. URLs of HTTP go out as given.
///
/// The operations that send something throw CurlError when a request cannot be set up; std::runtime_error "Failed to
/// add curl request header" when a header line is not to be had or would be several lines. A transfer that breaks off
/// throws nothing: the trace log has the reason, the status counts as failed, and what has arrived is returned.
/// Codes of the server are never faults: the status has them, and the body is what the server sent with them.
class KDD_EXPORT KxCurlClient
{
public:
    /// The client of the process, made on the first call and never destroyed.
    static KxCurlClient& instance();

    /// Whether a name is to be fetched rather than opened: begins with "http" or "gs". False for null.
    static bool isUrl(const char* name);

    /// The URL of a path of the own web service; nothing is escaped.
    static std::string url(const std::string& path);

    /// Sent as the query's "s", unescaped, to all but the cloud storage and the places where tokens come from, or to the
    /// hosts that the site's settings name (KDD_SESSION_HOSTS); empty: not at all.
    std::string sessionID() const;
    void setSessionID(const std::string& id);

    /// How an object is fetched in ranges: the length of the first [bytes], of which the others are at most half as
    /// long again, and how many at a time; below 2 it is fetched in one piece. A stream holds what arrives ahead of its
    /// reader, so it takes memory for that many ranges; in one piece, 1 MiB.
    int chunkSizeForPartialRequests() const;
    void setChunkSizeForPartialRequests(int bytes);
    int numConcurrentRequestsPerFile() const;
    void setNumConcurrentRequestsPerFile(int count);

    /// Connections that streams which begin afterwards leave open at least.
    int maxConnects() const;
    void setMaxConnects(int count);

    /// The service account's key, as JSON, by which requests to the cloud storage are authorised. Without one it comes
    /// from the file that the environment variable GOOGLE_APPLICATION_CREDENTIALS names, when it is first needed;
    /// requests go out unauthorised when there is none. A key that cannot be used is logged and changes nothing.
    void setGoogleAuthentication(const QJsonObject& key);

    /// Opens an object and waits for the first of it. `partial`: as several ranges at a time, when the settings and the
    /// server have it so; else in one request. `headers` are lines of name, colon, blank, value; a range among them is
    /// fetched in one request. A server that sends something other than that range fails the transfer.
    KxCurlDownloadStream read(const std::string& url, bool partial);
    KxCurlDownloadStream read(const std::string& url, const std::vector<std::string>& headers, bool partial);

    /// The same for a part of it: "first-last", "first-" or "-count", 0-based and inclusive.
    KxCurlDownloadStream readRange(const std::string& url, const std::string& range, bool partial);

    /// The same from a byte on (0-based) to the end, as several ranges at a time when the settings and the server have
    /// it so. With `start` beyond 0 it fails where the server knows no ranges or not the object's length.
    KxCurlDownloadStream readFrom(const std::string& url, qint64 start);

    /// The same from `start` on, wherever the server redirects to: up to five times, never from HTTPS to HTTP. Another
    /// server than the one that was asked is told neither authorisation nor session. A redirect that may not be followed
    /// fails the transfer.
    KxCurlDownloadStream readFollowing(const std::string& url, qint64 start = 0);

    /// The whole body, which may be up to 1 GiB; a longer one breaks off there.
    QByteArray readBytes(const std::string& url, KxHttpStatus& status);

    /// The body as JSON; a null document when it is none.
    QJsonDocument readJson(const std::string& url, KxHttpStatus& status);

    /// What must come from whom it is said to come from, such as keys that others are trusted by: the whole body, up to
    /// `most` bytes within `patience`. The server has to prove who it is whatever the site's settings say of others, by
    /// the certificates in `caFile` (PEM), or when that is empty those of the settings or the system; plain HTTP is for this machine
    /// alone. No session is told and no redirect followed. A failure, with `body` as it was, also for any code but 200.
    Result readTrusted(const std::string& url, const QByteArray& caFile, qint64 most,
                       std::chrono::milliseconds patience, QByteArray& body)
    {
        return askTrusted(url, caFile, {}, nullptr, most, patience, body);
    }

    /// The same for what is posted to such a server, with these header lines.
    Result postTrusted(const std::string& url, const QByteArray& caFile,
                       const std::vector<std::string>& headers, const QByteArray& form, qint64 most,
                       std::chrono::milliseconds patience, QByteArray& body)
    {
        return askTrusted(url, caFile, headers, &form, most, patience, body);
    }

    /// Sends a body, also an empty one, and returns the answer as JSON; a null document when it is none.
    QJsonDocument postBytes(const std::string& url, const QByteArray& body, const std::string& contentType,
                            KxHttpStatus& status);

    /// The same with the type "application/octet-stream".
    QJsonDocument postBytes(const std::string& url, const QByteArray& body, KxHttpStatus& status);

    /// The same with the object, indented, as "application/json".
    QJsonDocument postJson(const std::string& url, const QJsonObject& object, KxHttpStatus& status);

    /// Begins to write an object of the cloud storage. std::invalid_argument, before anything is sent, when the address
    /// can be none's: it names no object, has a "?", a "%" without two digits or a part of dots only.
    /// UnrecoverableResponseError when the storage refuses; RetryPolicyExhaustedError when it cannot be reached, which
    /// takes some 15 to 20 seconds.
    KxCurlUploadStream write(const std::string& url);

    /// Deletes an object of the cloud storage: whether the storage says so. Any other address is left alone, and the
    /// answer is true. std::invalid_argument as for `write`. CurlError also when the transfer breaks off.
    bool deleteObject(const std::string& url);

private:
    friend class KxGoogleAuth;
    struct Private;
    KxCurlClient();

    Result askTrusted(const std::string& url, const QByteArray& caFile,
                      const std::vector<std::string>& headers, const QByteArray* form, qint64 most,
                      std::chrono::milliseconds patience, QByteArray& body);

    /// As postBytes, but the session is none of the server's business.
    QJsonDocument postWithoutSession(const std::string& url, const QByteArray& body,
                                     const std::string& contentType, KxHttpStatus& status);

    Private* mPrivate;  // lives as long as the process
};

}  // namespace Kdd
