#pragma once

#include <QByteArray>
#include <QCryptographicHash>

#include <map>
#include <string>

namespace Kdd
{

class Result;
struct KxHttpStatus;

/// What is known of the bytes that were sent, to be held against what the cloud storage says that it has.
class UploadChecksums
{
public:
    /// The bytes that follow.
    void add(const QByteArray& bytes);

    quint64 length() const { return mLength; }

    /// Holds length, CRC-32C and MD5 against those that the storage names in the headers or the JSON of its answer to
    /// the last bytes. Fails with the first difference; nothing speaks against what is not named.
    Result compare(const KxHttpStatus& status, const QByteArray& response) const;

private:
    using Claims = std::map<std::string, std::string>;
    static Claims claimsOf(const KxHttpStatus& status, const QByteArray& response);
    Claims own() const;

    quint64 mLength = 0;
    quint32 mCrc32c = 0;
    QCryptographicHash mMd5{QCryptographicHash::Md5};
};

}  // namespace Kdd
