#include "kddlib/capi/Border.h"
#include "kddlib/capi/kddtagfile.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagfile/TagFileRemoval.h"
#include "platform/base/LogFile.h"
#include "platform/database/Kxg.h"
#include "platform/os/FileStatus.h"
#include "platform/os/PathName.h"
#include "platform/os/SystemLog.h"

#include <QDataStream>

#include <memory>

using namespace Kdd;

namespace
{

constexpr int kDebugFlag = 1;
constexpr int kTimingsFlag = 2;
const char* const kCategory = "kdd";

void configureLogging(int flags, const char* databaseServer)
{
    if (databaseServer != nullptr)
        Kxg::SetDatabaseServer(databaseServer);
    const bool isDebug = (flags & kDebugFlag) != 0;
    const bool hasTimings = (flags & kTimingsFlag) != 0;
    LogFile::setLevel(LogFile::Level::Everything);
    LogFile::setDebugLogging(isDebug);
    LogFile::setCallback(isDebug ? LogFile::Callback() : LogFile::Callback(writeToSystemLog));
    // All of them anew, so that a call leaves nothing of an earlier one.
    TagFile::setDebugOptions(hasTimings ? TagFile::kTimings : 0);
    if (isDebug)
        LogFile::printf("Configure logging: debug=%d timings=%d", 1, hasTimings ? 1 : 0);
}

/// Tells a study that has no tag file from one whose file cannot be read.
bool isThere(const QString& path)
{
    FileStatus status;
    return statusOf(pathBytes(path).constData(), status);
}

using Removal = int (TagFile::*)(int count, const char** uids);

/// Removes part of a study from its tag file, `what` for the log.
bool removeFrom(const char* studyUID, int count, const char** uids, Removal removal, const char* what)
{
    TagFile file;
    // Held from the reading to the writing, so that no change of others is lost.
    if (!file.readCacheFileForStudy(studyUID, true)) {
        if (isThere(TagFile::cacheFilePathForStudy(studyUID)))
            LogFile::errorf("Could not remove %s from the tag file of study %s: %s", what, studyUID,
                            qUtf8Printable(file.failure()));
        // From a damaged file nobody is shown anything; from one that others hold the images would be.
        return !file.wasLockedOut();
    }
    (file.*removal)(count, uids);
    return file.writeCacheFile();
}

std::unique_ptr<QByteArray> readAndSync(const char* studyUID, const char* user)
{
    TagFile file;
    if (!file.readAndSync(studyUID, user))
        return nullptr;
    // On the heap, because the caller's pointer is to its bytes, and the handle is the array itself.
    auto bytes = std::make_unique<QByteArray>();
    QDataStream out(bytes.get(), QIODevice::WriteOnly);
    if (!file.writeCacheFile(out)) {
        LogFile::tracef(3, kCategory, "Could not write tag file for study %s to data stream", studyUID);
        return nullptr;
    }
    LogFile::tracef(0, kCategory, "Loaded and synced tag file for study %s (%d bytes)", studyUID,
                    bytes->size());
    return bytes;
}

}  // namespace

void ConfigureLogging(short flags, const char* databaseServer)
{
    guarded(__func__, false, [&](const char* /*function*/) {
        configureLogging(flags, databaseServer);
        return true;
    });
}

bool DeleteImagesInTagFile(const char* studyUID, int count, const char** sopUIDs)
{
    return guarded(__func__, false, [&](const char* function) {
        return isGiven(function, "the study UID", studyUID) &&
               areGiven(function, "an image UID", count, sopUIDs) &&
               removeFrom(studyUID, count, sopUIDs, &TagFile::removeImages, "images");
    });
}

bool DeleteSeriesInTagFile(const char* studyUID, int count, const char** seriesUIDs)
{
    return guarded(__func__, false, [&](const char* function) {
        return isGiven(function, "the study UID", studyUID) &&
               areGiven(function, "a series UID", count, seriesUIDs) &&
               removeFrom(studyUID, count, seriesUIDs, &TagFile::removeSeries, "series");
    });
}

bool DeleteTagFile(const char* studyUID)
{
    return guarded(__func__, false, [&](const char* function) {
        return isGiven(function, "the study UID", studyUID) &&
               removeTagFile(TagFile::cacheFilePathForStudy(studyUID));
    });
}

void* ReadAndSyncTagFileData(const char* studyUID, const char* user, unsigned int* size, const char** data)
{
    return guarded(__func__, static_cast<void*>(nullptr), [&](const char* function) -> void* {
        if (!isGiven(function, "the size", size) || !isGiven(function, "the data", data))
            return nullptr;
        *size = 0;
        *data = nullptr;
        auto bytes = isGiven(function, "the study UID", studyUID) ? readAndSync(studyUID, user) : nullptr;
        if (bytes == nullptr)
            return nullptr;
        *size = static_cast<unsigned int>(bytes->size());
        *data = bytes->constData();
        return bytes.release();
    });
}

void FreeTagFileData(void* handle)
{
    delete static_cast<QByteArray*>(handle);
}
