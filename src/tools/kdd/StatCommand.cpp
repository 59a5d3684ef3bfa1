#include "tools/kdd/ByteReport.h"
#include "tools/kdd/Database.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Store.h"

#include <kddlib/ByteMap.h>
#include <kddlib/FileStatus.h>
#include <kddlib/LogFile.h>

#include <cstdio>
#include <memory>

namespace Kdd
{

namespace
{

struct StatRequest
{
    QList<QByteArray> studies;
    bool bytes = false;
    bool all = false;
};

Outcome showCounters(const GlobalOptions& options, const QByteArray& study)
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

/// The studies that are named, else all that have a tag file. False, with each fault logged, when one is not found.
bool chooseTagFiles(const QList<QByteArray>& named, QVector<QByteArray>& studyUIDs)
{
    if (!named.isEmpty()) {
        bool allFound = true;
        for (const QByteArray& text : named) {
            QByteArray studyUID;
            // One by one, because a study that is named in full needs no database.
            if (!resolveStudy(text, studyUID))
                allFound = false;
            else if (!studyUIDs.contains(studyUID))
                studyUIDs.append(studyUID);
        }
        return allFound;
    }
    const std::unique_ptr<Kxg::Catalogue> database = openExistingDatabase();
    QVector<QByteArray> registered;
    if (database == nullptr || !chooseStudies(*database, {}, true, registered))
        return false;
    for (const QByteArray& studyUID : qAsConst(registered)) {
        // What was only indexed has none yet.
        if (presenceOf(TagFile::cacheFilePathForStudy(studyUID.constData())) != FilePresence::Absent)
            studyUIDs.append(studyUID);
    }
    return true;
}

Outcome showBytes(const GlobalOptions& options, const StatRequest& request)
{
    QVector<QByteArray> studyUIDs;
    if (!chooseTagFiles(request.studies, studyUIDs))
        return Outcome::Failed;
    ByteMap map;
    int failed = 0;
    for (const QByteArray& studyUID : qAsConst(studyUIDs)) {
        const QString path = TagFile::cacheFilePathForStudy(studyUID.constData());
        const Result added = map.addFile(path, studyUID.constData());
        if (added.good())
            continue;
        ++failed;
        LogFile::errorf("Study %s cannot be read from %s: %s", studyUID.constData(), qUtf8Printable(path),
                        qUtf8Printable(added.text()));
    }
    printBytes(options, map, failed, request.all);
    return failed == 0 ? Outcome::Done : Outcome::Failed;
}

Outcome runStat(const GlobalOptions& options, const StatRequest& request)
{
    if (request.bytes)
        return showBytes(options, request);
    if (request.all || request.studies.size() != 1) {
        LogFile::errorf("Name one study, or --bytes for where the bytes of studies go");
        return Outcome::WrongUsage;
    }
    return showCounters(options, request.studies.first());
}

}  // namespace

void declareStat(CommandSet& commands)
{
    const CommandText text = {
        "stat", kLooking, "Show counters and sizes of a study's tag file, or where the bytes go",
        "Sizes are in bytes, times in milliseconds. --bytes tells of the studies that are named, or of all, "
        "what "
        "their tag files are made of: each level, items, volumes and previews, which add up to the files, "
        "and the "
        "attributes that cost most, before and after compression. What an attribute costs after compression "
        "is "
        "read off the compressed file: a literal counts for the attribute that it stands in, a repetition in "
        "equal "
        "parts for the bytes that it repeats. Heads of records are their levels and lengths.",
        "kdd stat 2.25.2062\n"
        "kdd stat --bytes                       # of the whole archive\n"
        "kdd --json stat 2.25.2062 --bytes --all"};
    const auto request = std::make_shared<StatRequest>();
    ArgumentList arguments = commands.declare(
        text, [request](const GlobalOptions& options) { return runStat(options, *request); });
    arguments.texts({"UID", kStudy, "Study Instance UIDs, or unique beginnings of them"}, request->studies);
    arguments.flag("--bytes", request->bytes, "What the bytes of the tag files are spent for");
    arguments.flag("--all", request->all, "With --bytes: every attribute, not only the dearest");
}

}  // namespace Kdd
