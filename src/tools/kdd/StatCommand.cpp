#include "tools/kdd/Commands.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Store.h"

#include <QFileInfo>

#include <cstdio>

namespace Kdd
{

Outcome runStat(const GlobalOptions& options, const QByteArray& study)
{
    TagFile file;
    if (!readStudy(study, file))
        return Outcome::Failed;
    int series = 0, images = 0, volumes = 0, blobs = 0, optimiseMs = 0, readMs = 0, writeMs = 0;
    int storedSize = 0, uncompressedSize = 0, unoptimisedSize = 0, blobBytes = 0;
    file.getStatistics(series, images, volumes, blobs, optimiseMs, readMs, writeMs, storedSize,
                       uncompressedSize, unoptimisedSize, blobBytes);
    const struct
    {
        const char* name;
        qint64 value;
    } rows[] = {{"series", series},
                {"images", images},
                {"volumes", volumes},
                {"blobs", blobs},
                {"optimiseMs", optimiseMs},
                {"readMs", readMs},
                {"writeMs", writeMs},
                {"storedSize", storedSize},
                {"uncompressedSize", uncompressedSize},
                {"unoptimisedSize", unoptimisedSize},
                {"blobBytes", blobBytes},
                {"fileSize", QFileInfo(file.cacheFilePath()).size()}};
    if (options.json) {
        QJsonObject object;
        for (const auto& row : rows)
            object.insert(QLatin1String(row.name), row.value);
        printJson(object);
    } else {
        for (const auto& row : rows)
            std::printf("%-16s %lld\n", row.name, static_cast<long long>(row.value));
    }
    return Outcome::Done;
}

}  // namespace Kdd
