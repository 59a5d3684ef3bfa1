#include "kddlib/net/KxCurlClient.h"

#include "kddlib/net/ClientSettings.h"
#include "kddlib/net/cloud/CloudAddress.h"
#include "kddlib/net/cloud/KxCurlUploadStream.h"
#include "kddlib/net/cloud/KxCurlUploadStreambuf.h"
#include "kddlib/net/cloud/KxGoogleAuth.h"
#include "kddlib/net/http/CurlShare.h"
#include "kddlib/net/http/HttpAnswer.h"
#include "kddlib/net/http/KxCurlDownloadStream.h"
#include "kddlib/net/http/KxCurlDownloadStreambuf.h"
#include "kddlib/net/http/KxCurlRequest.h"
#include "kddlib/net/http/Redirects.h"
#include "kddlib/net/http/RequestAddress.h"
#include "kddlib/net/http/TlsLocks.h"
#include "kddlib/net/http/WebOrigin.h"
#include "kddlib/net/http/WholeBody.h"
#include "platform/base/Result.h"
#include "platform/resources/ExResource.h"

#include <QJsonDocument>
#include <QJsonObject>

#include <algorithm>
#include <mutex>
#include <stdexcept>
#include <string_view>
#include <thread>
#include <utility>

namespace Kdd
{
namespace
{

/// More threads than that at once only find fewer connections open.
constexpr std::size_t kIdleHandles = 48;

/// Curl and the library below it, once for the process.
void setUpCurl()
{
    // Once and before any handle, for other threads must not be in the libraries meanwhile.
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

bool isThisMachine(const std::string& host)
{
    return host == "127.0.0.1" || host == "localhost" || host == "[::1]" || host == "::1";
}

void requireCloudObject(const std::string& address)
{
    if (const Result result = checkCloudObject(address); result.bad())
        throw std::invalid_argument(address + ' ' + result.text().toStdString());
}

}  // namespace

struct KDD_LOCAL KxCurlClient::Private
{
    /// A copy, so that no request sees half of a change.
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

    KxCurlDownloadStream open(KxCurlDownloadRequest::Origin origin,
                              std::optional<ByteRange> firstRange) const;
    KxCurlDownloadStream get(const std::function<PreparedRequest()>& prepare,
                             std::optional<ByteRange> firstRange) const;
    QJsonDocument post(const std::function<PreparedRequest()>& prepare, const QByteArray& body,
                       KxHttpStatus& status) const;

    mutable std::mutex mutex;
    ClientSettings settings;
    KxGoogleAuth googleAuthentication;
    const CurlShare::Connections connections = connectionsOfSite();
    CurlShare share{connections};
    std::shared_ptr<KxCurlHandleFactory> handles =
        std::make_shared<KxCurlHandleFactory>(kIdleHandles, connections);

    /// For uploads and deletions: a handle that has carried a stream has no connection left for these.
    std::shared_ptr<KxCurlHandleFactory> ownHandles =
        std::make_shared<KxCurlHandleFactory>(kIdleHandles, connections);
};

/// The stream once the first bytes of its response are there.
KxCurlDownloadStream KxCurlClient::Private::open(KxCurlDownloadRequest::Origin origin,
                                                 std::optional<ByteRange> firstRange) const
{
    // One for each stream: its requests are driven together, by whoever reads it.
    origin.multi = std::make_shared<KxCurlDownloadRequest::MultiMap>(handles);
    origin.share = &share;
    const int concurrent = currentSettings().numConcurrentRequestsPerFile;
    auto buffer = std::make_unique<KxCurlDownloadStreambuf>(std::move(origin), firstRange, concurrent);
    KxCurlDownloadStream stream(buffer.release());
    // Who gets the stream may ask for the answer's code and length at once.
    stream.peek();
    return stream;
}

KxCurlDownloadStream KxCurlClient::Private::get(const std::function<PreparedRequest()>& prepare,
                                                std::optional<ByteRange> firstRange) const
{
    KxCurlDownloadRequest::Origin origin;
    // What is to be had without authorisation must not ask for it, in vain, with every range.
    PreparedRequest first = prepare();
    if (isAuthorised(first))
        origin.prepare = prepare;
    else
        origin.prepare = [first = std::move(first)] { return PreparedRequest(first); };
    return open(std::move(origin), firstRange);
}

/// In one piece, because an answer to a body is no object that could be asked for by ranges.
QJsonDocument KxCurlClient::Private::post(const std::function<PreparedRequest()>& prepare,
                                          const QByteArray& body, KxHttpStatus& status) const
{
    KxCurlDownloadRequest::Origin origin;
    origin.prepare = prepare;
    origin.body = body;
    origin.hasBody = RequestBody::Sent;
    KxCurlDownloadStream stream = open(std::move(origin), std::nullopt);
    return QJsonDocument::fromJson(readWholeBody(stream, status));
}

KxCurlClient::KxCurlClient()
{
    setUpCurl();
    // Only now: its members make handles.
    mPrivate = new Private;
    // The client is never destroyed, so it may be kept.
    mPrivate->settings.authorization = [this] {
        return mPrivate->googleAuthentication.authorizationHeader(*this).toStdString();
    };
}

KxCurlClient& KxCurlClient::instance()
{
    // Never destroyed: threads may still be at work when the process ends.
    static auto* const client = new KxCurlClient;
    return *client;
}

bool KxCurlClient::isUrl(const char* name)
{
    const std::string_view text = name ? name : "";
    return text.substr(0, 4) == "http" || text.substr(0, 2) == "gs";
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

void KxCurlClient::setGoogleAuthentication(const QJsonObject& key)
{
    mPrivate->googleAuthentication.loadCredentialsFromJson(key, "");
}

KxCurlDownloadStream KxCurlClient::read(const std::string& url, bool partial)
{
    return read(url, {}, partial);
}

KxCurlDownloadStream KxCurlClient::read(const std::string& url, const std::vector<std::string>& headers,
                                        bool partial)
{
    // Who asks for a range himself gets that range; ours would take its place.
    const bool hasRange = std::any_of(headers.begin(), headers.end(), isRangeHeader);
    const auto range = partial && !hasRange ? firstRange(mPrivate->currentSettings()) : std::nullopt;
    const auto prepare = [=] {
        return prepareRequest(url, headers, RequestBody::None, mPrivate->currentSettings());
    };
    return mPrivate->get(prepare, range);
}

KxCurlDownloadStream KxCurlClient::readRange(const std::string& url, const std::string& range, bool partial)
{
    return read(url, {"Range: bytes=" + range}, partial);
}

KxCurlDownloadStream KxCurlClient::readFrom(const std::string& url, qint64 start)
{
    const auto range = firstRange(mPrivate->currentSettings(), start);
    // Without parallel ranges one open range does, which any server that knows ranges answers.
    if (!range)
        return readRange(url, std::to_string(start) + '-', false);
    return mPrivate->get(
        [=] { return prepareRequest(url, {}, RequestBody::None, mPrivate->currentSettings()); }, range);
}

KxCurlDownloadStream KxCurlClient::readFollowing(const std::string& url, qint64 start)
{
    const auto range = firstRange(mPrivate->currentSettings(), start);
    std::vector<std::string> headers;
    if (!range && start > 0)
        headers.push_back("Range: bytes=" + std::to_string(start) + '-');
    std::optional<Redirects> redirects;
    // Each round is a request of its own, to where the answer before it led.
    for (;;) {
        const auto prepare = [=] {
            const ClientSettings settings = mPrivate->currentSettings();
            PreparedRequest first = prepareRequest(url, headers, RequestBody::None, settings);
            return redirects ? redirects->prepared(std::move(first), settings.sessionId) : first;
        };
        // Its later ranges are prepared in the same way, so they are told no more than the first.
        KxCurlDownloadStream stream = mPrivate->get(prepare, range);
        if (!redirects)
            redirects.emplace(prepareRequest(url, {}, RequestBody::None, ClientSettings()).url);
        Result result;
        if (redirects->follow(stream.httpStatus(), result))
            continue;
        if (result.bad())
            // The stream is told, for its reader asks that and nobody else what became of the transfer.
            static_cast<KxCurlDownloadStreambuf*>(stream.rdbuf())
                ->currentRequest()
                ->fail(result.text().toStdString());
        return stream;
    }
}

QByteArray KxCurlClient::readBytes(const std::string& url, KxHttpStatus& status)
{
    KxCurlDownloadStream stream = read(url, true);
    return readWholeBody(stream, status);
}

QJsonDocument KxCurlClient::readJson(const std::string& url, KxHttpStatus& status)
{
    return QJsonDocument::fromJson(readBytes(url, status));
}

Result KxCurlClient::askTrusted(const std::string& url, const QByteArray& caFile,
                                const std::vector<std::string>& headers, const QByteArray* form, qint64 most,
                                std::chrono::milliseconds patience, QByteArray& body)
{
    const WebOrigin origin = originOf(url);
    if (!origin.isValid() || (origin.scheme == "http" && !isThisMachine(origin.host)))
        return Result::failure(QStringLiteral("it is no address of HTTPS"))
            .within(QString::fromStdString(url));
    try {
        KxCurlRequest request(mPrivate->ownHandles, mPrivate->share, url, form != nullptr ? "POST" : "GET");
        request.demandProof(caFile);
        request.setBounds(most, patience);
        for (const std::string& header : headers)
            request.addHeader(header);
        if (form != nullptr)
            request.perform(*form);
        else
            request.perform();
        if (request.status().code != kOk)
            return Result::failure(QString::fromStdString(request.status().reason().empty()
                                                              ? "it is elsewhere"
                                                              : request.status().reason()))
                .within(QString::fromStdString(url));
        body = request.response();
    } catch (const std::exception& fault) {
        return Result::failure(QString::fromUtf8(fault.what())).within(QString::fromStdString(url));
    }
    return {};
}

QJsonDocument KxCurlClient::postBytes(const std::string& url, const QByteArray& body,
                                      const std::string& contentType, KxHttpStatus& status)
{
    const auto prepare = [&] {
        return prepareRequest(url, {"Content-Type: " + contentType}, RequestBody::Sent,
                              mPrivate->currentSettings());
    };
    return mPrivate->post(prepare, body, status);
}

QJsonDocument KxCurlClient::postWithoutSession(const std::string& url, const QByteArray& body,
                                               const std::string& contentType, KxHttpStatus& status)
{
    const auto prepare = [&] {
        return prepareRequest(url, {"Content-Type: " + contentType}, RequestBody::Sent, ClientSettings());
    };
    return mPrivate->post(prepare, body, status);
}

QByteArray KxGoogleAuth::authorizationHeader(KxCurlClient& client)
{
    return authorizationHeader(
        [&client](const std::string& url, const QByteArray& form, KxHttpStatus& status) {
            return client.postWithoutSession(url, form, "application/x-www-form-urlencoded", status);
        });
}

QJsonDocument KxCurlClient::postBytes(const std::string& url, const QByteArray& body, KxHttpStatus& status)
{
    return postBytes(url, body, "application/octet-stream", status);
}

QJsonDocument KxCurlClient::postJson(const std::string& url, const QJsonObject& object, KxHttpStatus& status)
{
    return postBytes(url, QJsonDocument(object).toJson(), "application/json", status);
}

KxCurlUploadStream KxCurlClient::write(const std::string& url)
{
    requireCloudObject(url);
    UploadTarget target;
    target.url = cloudUrl(url, CloudEndpoint::Upload);
    // Without credentials each chunk would ask for them in vain.
    if (!authorizationHeader(mPrivate->currentSettings()).empty())
        target.authorization = [this] { return authorizationHeader(mPrivate->currentSettings()); };
    auto session = std::make_unique<KxCurlUploadSession>(
        mPrivate->ownHandles, mPrivate->share, std::move(target),
        [](std::chrono::milliseconds delay) { std::this_thread::sleep_for(delay); });
    return KxCurlUploadStream(std::make_unique<KxCurlUploadStreambuf>(std::move(session)));
}

bool KxCurlClient::deleteObject(const std::string& url)
{
    if (!isCloudAddress(url))
        return true;
    requireCloudObject(url);
    const ClientSettings settings = mPrivate->currentSettings();
    KxCurlRequest request(mPrivate->ownHandles, mPrivate->share, cloudUrl(url, CloudEndpoint::Api), "DELETE");
    for (const std::string& line : cloudHeaders(authorizationHeader(settings)))
        request.addHeader(line);
    request.perform();
    return request.status().ok();
}

}  // namespace Kdd
