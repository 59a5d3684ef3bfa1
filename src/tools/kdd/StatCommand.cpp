#include "tools/kdd/Report.h"
#include "tools/kdd/Selection.h"
#include "tools/kdd/Store.h"

#include <cstdio>
#include <memory>

namespace Kdd
{

namespace
{

Outcome runStat(const GlobalOptions& options, const QByteArray& study)
{
    TagFile file;
    if (!readStudy(study, file))
        return Outcome::Failed;
    const TagFile::Statistics statistics = file.statistics();
    // One list for both forms, so that they name the same figures.
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
                {"fileSize", sizeOf(file.cacheFilePath())}};
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

}  // namespace

void declareStat(CommandSet& commands)
{
    const CommandText text = {"stat", kLooking, "Show counters and sizes of a study's tag file",
                              "Sizes are in bytes, times in milliseconds.", "kdd stat 2.25.2062"};
    const auto request = std::make_shared<QByteArray>();
    ArgumentList arguments = commands.declare(
        text, [request](const GlobalOptions& options) { return runStat(options, *request); });
    arguments.text(kOneStudy, *request);
}

}  // namespace Kdd
