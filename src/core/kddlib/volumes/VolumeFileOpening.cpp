#include "kddlib/volumes/VolumeFileOpening.h"

#include "kddlib/net/KxCurlClient.h"
#include "kddlib/net/http/KxHttpStatus.h"
#include "kddlib/net/http/ObjectAddress.h"
#include "platform/volumefile/OrlanMesh.h"

#include <exception>

namespace Kdd
{

namespace
{

Result download(const QByteArray& url, QByteArray& bytes)
{
    std::string reason;
    try {
        KxHttpStatus status;
        bytes = KxCurlClient::instance().readBytes(url.toStdString(), status);
        if (status.ok())
            return {};
        reason = status.reason();
    } catch (const std::exception& fault) {
        reason = fault.what();
    }
    return Result::failure(QStringLiteral("Reading %1 failed: %2")
                               .arg(QString::fromUtf8(shownAddress(url)), QString::fromStdString(reason)));
}

}  // namespace

std::unique_ptr<OrlanMesh> openVolumeFile(const QByteArray& path, Result& result)
{
    if (!KxCurlClient::isUrl(path.constData()))
        return OrlanMesh::read(path, result);
    QByteArray bytes;
    result = download(path, bytes);
    return result.good() ? OrlanMesh::read(bytes, path, result) : nullptr;
}

}  // namespace Kdd
