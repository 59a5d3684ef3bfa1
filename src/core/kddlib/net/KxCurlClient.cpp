#include "kddlib/net/KxCurlClient.h"

#include "kddlib/net/CurlShare.h"
#include "kddlib/net/KxCurlRequest.h"
#include "kddlib/net/PreparedRequest.h"
#include "kddlib/net/RequestAddress.h"
#include "kddlib/net/TlsLocks.h"
#include "platform/base/LogFile.h"
#include "platform/resources/ExResource.h"

#include <QJsonDocument>
#include <QJsonObject>

#include <mutex>

namespace Kdd
{
namespace
{

constexpr std::size_t kIdleHandles = 48;

/// Curl and the library below it, once for the process.
void setUpCurl()
{
    static std::once_flag once;
    std::call_once(once, [] {
        if (const CURLcode code = curl_global_init(CURL_GLOBAL_ALL))
            throw CurlError(code);
        const char* tlsVersion = curl_version_info(CURLVERSION_NOW)->ssl_version;
        installTlsLocks(tlsVersion ? tlsVersion : "", linkedCryptoLibrary());
    });
}

CurlShare::Connections connectionsOfSite()
{
    return ExResource::sharesConnections() ? CurlShare::Connections::Shared
                                           : CurlShare::Connections::PerHandle;
}

}  // namespace

struct KxCurlClient::Private
{
    ClientSettings currentSettings() const
    {
        const std::lock_guard lock(mutex);
        return settings;
    }

    template <typename Value>
    void change(Value ClientSettings::*setting, const Value& value)
    {
        const std::lock_guard lock(mutex);
        settings.*setting = value;
    }

    QByteArray transfer(const PreparedRequest& prepared, const QByteArray* body, KxHttpStatus& status) const;

    mutable std::mutex mutex;
    ClientSettings settings;
    CurlShare share{connectionsOfSite()};
    std::shared_ptr<KxCurlHandleFactory> handles = std::make_shared<KxCurlHandleFactory>(kIdleHandles);
};

QByteArray KxCurlClient::Private::transfer(const PreparedRequest& prepared, const QByteArray* body,
                                           KxHttpStatus& status) const
{
    KxCurlRequest request(handles, share, prepared.url, body ? "POST" : "GET");
    for (const std::string& line : prepared.headers)
        request.addHeader(line);
    try {
        if (body)
            request.perform(*body);
        else
            request.perform();
    } catch (const CurlError& error) {
        LogFile::tracef(3, "CURL", "%s: %s", "transfer", error.what());
    }
    status = request.status();
    return request.response();
}

KxCurlClient::KxCurlClient()
{
    setUpCurl();
    mPrivate = new Private;
}

KxCurlClient& KxCurlClient::instance()
{
    static auto* const client = new KxCurlClient;
    return *client;
}

bool KxCurlClient::isUrl(const char* name)
{
    return Kdd::isUrl(name);
}

std::string KxCurlClient::url(const std::string& path)
{
    return webServiceUrl(path);
}

std::string KxCurlClient::sessionID() const
{
    return mPrivate->currentSettings().sessionId;
}

void KxCurlClient::setSessionID(const std::string& id)
{
    mPrivate->change(&ClientSettings::sessionId, id);
}

int KxCurlClient::chunkSizeForPartialRequests() const
{
    return mPrivate->currentSettings().chunkSizeForPartialRequests;
}

void KxCurlClient::setChunkSizeForPartialRequests(int bytes)
{
    mPrivate->change(&ClientSettings::chunkSizeForPartialRequests, bytes);
}

int KxCurlClient::numConcurrentRequestsPerFile() const
{
    return mPrivate->currentSettings().numConcurrentRequestsPerFile;
}

void KxCurlClient::setNumConcurrentRequestsPerFile(int count)
{
    mPrivate->change(&ClientSettings::numConcurrentRequestsPerFile, count);
}

int KxCurlClient::maxConnects() const
{
    return mPrivate->handles->maxConnects();
}

void KxCurlClient::setMaxConnects(int count)
{
    mPrivate->handles->setMaxConnects(count);
}

void KxCurlClient::setAuthorization(const Authorization& authorization)
{
    mPrivate->change(&ClientSettings::authorization, authorization);
}

QByteArray KxCurlClient::readBytes(const std::string& url, KxHttpStatus& status)
{
    const PreparedRequest prepared = prepareRequest(url, {}, RequestBody::None, mPrivate->currentSettings());
    return mPrivate->transfer(prepared, nullptr, status);
}

QJsonDocument KxCurlClient::readJson(const std::string& url, KxHttpStatus& status)
{
    return QJsonDocument::fromJson(readBytes(url, status));
}

QJsonDocument KxCurlClient::postBytes(const std::string& url, const QByteArray& body,
                                      const std::string& contentType, KxHttpStatus& status)
{
    const PreparedRequest prepared =
        prepareRequest(url, {"Content-Type: " + contentType}, RequestBody::Sent, mPrivate->currentSettings());
    return QJsonDocument::fromJson(mPrivate->transfer(prepared, &body, status));
}

QJsonDocument KxCurlClient::postBytes(const std::string& url, const QByteArray& body, KxHttpStatus& status)
{
    return postBytes(url, body, "application/octet-stream", status);
}

QJsonDocument KxCurlClient::postJson(const std::string& url, const QJsonObject& object, KxHttpStatus& status)
{
    return postBytes(url, QJsonDocument(object).toJson(), "application/json", status);
}

bool KxCurlClient::deleteObject(const std::string& url)
{
    if (!isCloudAddress(url))
        return true;
    // Handles of its own, as deletions are rare and must not push out what reads keep.
    const auto handles = std::make_shared<KxCurlHandleFactory>(1);
    const ClientSettings settings = mPrivate->currentSettings();
    KxCurlRequest request(handles, mPrivate->share, cloudUrl(url, CloudEndpoint::Api), "DELETE");
    for (const std::string& line : cloudHeaders(authorizationHeader(settings)))
        request.addHeader(line);
    request.perform();
    return request.status().ok();
}

}  // namespace Kdd
