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
    const TagFile::Statistics statistics = file.statistics();
    const struct
    {
        const char* name;
        qint64 value;
    } rows[] = {{"series", statistics.series},
                {"images", statistics.images},
                {"volumes", statistics.volumes},
                {"blobs", statistics.blobs},
                {"optimiseMs", statistics.optimiseMs},
                {"readMs", statistics.readMs},
                {"writeMs", statistics.writeMs},
                {"storedSize", statistics.storedSize},
                {"uncompressedSize", statistics.uncompressedSize},
                {"unoptimisedSize", statistics.unoptimisedSize},
                {"blobBytes", statistics.blobBytes},
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
