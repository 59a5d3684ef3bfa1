#include "server/StatusPages.h"

#include <QFileInfo>

#include <kddlib/StorageManager.h>
#include <kddlib/TagFile.h>

namespace Kdd
{
namespace
{

/// Not for a store's volumes, but for whether the database answers.
Http::Response readiness()
{
    if (Kxg::StorageManager::retrieveStorageVolumes().bad())
        return Http::failure(503, QStringLiteral("The image database does not answer"));
    const QFileInfo folder(QFile::decodeName(TagFile::metaFolder()));
    if (!folder.isDir() || !folder.isReadable() || !folder.isExecutable())
        return Http::failure(503, QStringLiteral("The folder of the tag files cannot be read"));
    return Http::textResponse(200, "text/plain; charset=utf-8", "ready\n");
}

}  // namespace

Http::Response StatusPages::answer(const Http::Request& request)
{
    const QByteArray page = request.path.size() == 1 ? request.path[0] : QByteArray();
    if (page == "healthz")
        return Http::textResponse(200, "text/plain; charset=utf-8", "alive\n");
    if (page == "readyz")
        return readiness();
    if (page == "metrics")
        return Http::textResponse(200, "text/plain; version=0.0.4; charset=utf-8", mMetrics.text());
    return Http::failure(404, QStringLiteral("There are /healthz, /readyz and /metrics"));
}

}  // namespace Kdd
