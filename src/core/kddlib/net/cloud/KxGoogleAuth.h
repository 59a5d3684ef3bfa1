#pragma once

#include "platform/base/Export.h"

#include <QByteArray>

#include <functional>
#include <memory>
#include <string>
#include <vector>

class QJsonDocument;
class QJsonObject;

namespace Kdd
{

class KxCurlClient;
struct KxHttpStatus;

/// Gets access tokens for the cloud storage with a service account's key: it signs who it is, exchanges that at the
/// place that the key names, and keeps the token until shortly before it expires.
///
/// Any thread may use it. While a token is fetched the other threads wait for it, so that one exchange serves all.
/// Nothing throws for bad credentials or a refused token: one error in the log tells the reason, and there is no header.
class KDD_EXPORT KxGoogleAuth
{
public:
    /// The time since 1970 [100 ns].
    using Clock = std::function<qint64()>;

    /// Posts a form ("application/x-www-form-urlencoded") to the URL where tokens come from and gives the answer, null
    /// when it is no JSON, and what became of the request.
    using Exchange =
        std::function<QJsonDocument(const std::string& url, const QByteArray& form, KxHttpStatus& status)>;

    /// Follows the system's clock.
    KxGoogleAuth();
    explicit KxGoogleAuth(Clock clock);
    ~KxGoogleAuth();
    KxGoogleAuth(const KxGoogleAuth&) = delete;
    KxGoogleAuth& operator=(const KxGoogleAuth&) = delete;

    /// Reads the key from the file that the environment variable GOOGLE_APPLICATION_CREDENTIALS names. False, with an
    /// error in the log and the former key still in force, when there is no such file or it holds no usable key.
    bool loadCredentials();

    /// The same with the key's JSON itself; `source` names its origin in messages. A new key ends the use of the
    /// former one's token.
    bool loadCredentialsFromJson(const QJsonObject& object, const char* source);

    /// What tokens are good for, as the provider writes it; none: everything in the cloud that the account may do.
    /// Holds for tokens fetched from now on.
    void setScopes(const std::vector<std::string>& scopes);

    /// On whose behalf tokens are asked for, when that is not the account itself. As above.
    void setSubject(const std::string& subject);

    /// "Authorization: " and the token, or empty when none is to be had. Reads the key first when none was given. A
    /// token in its last 500 seconds is replaced. Passes on what the exchange throws.
    QByteArray authorizationHeader(const Exchange& exchange);

    /// The same with an exchange by a client, which may throw CurlError. Belongs to the client, above this class.
    QByteArray authorizationHeader(KxCurlClient& client);

private:
    struct Private;
    std::unique_ptr<Private> mPrivate;
};

}  // namespace Kdd
