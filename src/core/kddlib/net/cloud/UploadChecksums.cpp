#include "kddlib/net/cloud/UploadChecksums.h"

#include "kddlib/net/cloud/Crc32c.h"
#include "kddlib/net/http/HttpAnswer.h"
#include "kddlib/net/http/KxHttpStatus.h"
#include "platform/base/Result.h"

#include <QJsonDocument>
#include <QJsonObject>
#include <QList>
#include <QtEndian>

namespace Kdd
{
namespace
{

constexpr int kLongestDescription = 1024 * 1024;  // [bytes]; a longer answer describes no object

// The checksums as the storage names and writes them: base64, the numbers big-endian.
constexpr char kLength[] = "length";
constexpr char kCrc32c[] = "crc32c";
constexpr char kMd5[] = "md5";

}  // namespace

void UploadChecksums::add(const QByteArray& bytes)
{
    mLength += static_cast<quint64>(bytes.size());
    mCrc32c = crc32c(bytes, mCrc32c);
    mMd5.addData(bytes);
}

UploadChecksums::Claims UploadChecksums::own() const
{
    QByteArray crc(sizeof mCrc32c, '\0');
    qToBigEndian(mCrc32c, crc.data());
    return {{kLength, std::to_string(mLength)},
            {kCrc32c, crc.toBase64().toStdString()},
            {kMd5, mMd5.result().toBase64().toStdString()}};
}

UploadChecksums::Claims UploadChecksums::claimsOf(const KxHttpStatus& status, const QByteArray& response)
{
    Claims claims;
    if (response.size() <= kLongestDescription) {
        const QJsonObject object = QJsonDocument::fromJson(response).object();
        const std::pair<const char*, const char*> fields[] = {
            {"size", kLength}, {"crc32c", kCrc32c}, {"md5Hash", kMd5}};
        for (const auto& [field, name] : fields)
            claims[name] = object.value(QLatin1String(field)).toString().toStdString();
    }
    if (const std::string* const length = findHeader(status, "x-goog-stored-content-length"))
        claims[kLength] = *length;
    // One line with all checksums, or one line for each, of which the last is known.
    const std::string* const header = findHeader(status, "x-goog-hash");
    const QByteArray hashes = header ? QByteArray::fromStdString(*header) : QByteArray();
    for (const QByteArray& hash : hashes.split(',')) {
        // The first one: base64 may end in others.
        const int end = hash.indexOf('=');
        claims[hash.left(end).trimmed().toStdString()] = hash.mid(end + 1).trimmed().toStdString();
    }
    return claims;
}

Result UploadChecksums::compare(const KxHttpStatus& status, const QByteArray& response) const
{
    Claims claims = claimsOf(status, response);
    for (const auto& [name, value] : own()) {
        const std::string& claim = claims[name];
        // What the storage does not name speaks for nothing and against nothing.
        if (!claim.empty() && claim != value)
            return Result::failure(QString::fromStdString(name + ' ' + claim + " instead of " + value));
    }
    return {};
}

}  // namespace Kdd
