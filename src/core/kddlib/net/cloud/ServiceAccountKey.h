#pragma once

#include <string>

class QJsonObject;

namespace Kdd
{

class Result;

/// What a service account's key says: on whose behalf tokens are asked for, where, and signed with what. UTF-8.
struct ServiceAccountKey
{
    std::string id;
    std::string privateKey;  ///< PEM; empty: no key has been read
    std::string clientEmail;
    std::string tokenUri;
};

/// Reads the key from JSON as the provider hands it out. Fails, with a reason that names the field and `source`, and
/// `key` as it was, when the type is not "service_account", a field is missing, or the place of tokens is no web
/// address. Without such a place the site's setting holds.
Result readServiceAccountKey(const QJsonObject& object, const char* source, ServiceAccountKey& key);

/// The same from the file that the environment variable GOOGLE_APPLICATION_CREDENTIALS names, of at most 64 KiB.
Result readServiceAccountFile(ServiceAccountKey& key);

}  // namespace Kdd
