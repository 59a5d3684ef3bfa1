#pragma once

#include "platform/base/Export.h"

// NOLINTBEGIN(modernize-deprecated-headers): C programs include this, too.
#include <stdbool.h>
#include <stddef.h>
// NOLINTEND(modernize-deprecated-headers)

#ifdef __cplusplus
extern "C" {
#endif

// NOLINTBEGIN(readability-identifier-naming): these names are the interface.

/// Tag files for programs that cannot use the library's classes: logging, removal, correction, reading.
///
/// Each call stands for itself; nothing but the settings of `ConfigureLogging` is kept between calls. Every function
/// but that one may be called on any thread and by several at once, also for one and the same study and from several
/// processes: who changes a tag file holds it alone meanwhile, and the others wait. They try for 0.4 seconds and then
/// fail, but for `DeleteTagFile`, which gives up after 50 ms, and `ReadAndSyncTagFileData`, which goes on for as long as
/// the site's settings say, 2 seconds without them.
///
/// Texts end with a zero byte, are UTF-8 and stay the caller's. A pointer that must not be null but is, or a negative
/// count, makes a call do nothing but log and report failure. No C++ exception leaves a function; it is a failure,
/// too. The reason of every failure is a line in the log.
///
/// The tag files lie below the meta folder: the one that the site's settings name (KDD_META_FOLDER), else the one
/// that the image database knows.

/// Sets up logging; to be called once, before other threads use the library. `databaseServer` is the address of the
/// image database, "sqlite:FILE" or "postgresql://[USER[:PASSWORD]@]HOST[:PORT]/DATABASE"; null leaves it as it is.
///
/// From then on everything is logged. Bit 0 of `flags`, debug: lines go to standard error and, when the environment
/// variable KDD_LOG_FILE names one, to a file, and they tell how long tag files took to read and to write, and of each
/// that is not there. Without it they go to the system's log (syslog). Bit 1, timings: also how long corrections took.
KDD_EXPORT void ConfigureLogging(short flags, const char* databaseServer);

/// Removes images from a study's tag file by their SOP Instance UIDs. UIDs that it does not hold are passed over;
/// series that become empty go as well, and with the last image the file.
///
/// True when all is written, or when the study has no tag file that can be read: a damaged one, of which an error line
/// tells, shows nothing of them either. False when others held the file all the time or it could not be written; it
/// then holds what it held.
KDD_EXPORT bool DeleteImagesInTagFile(const char* studyUID, int count, const char** sopUIDs);

/// The same for whole series, by Series Instance UID.
KDD_EXPORT bool DeleteSeriesInTagFile(const char* studyUID, int count, const char** seriesUIDs);

/// Deletes a study's tag file. True when there is none any more; false when it could not be deleted in six attempts
/// within 50 ms, because others held it or the system refused.
KDD_EXPORT bool DeleteTagFile(const char* studyUID);

/// Corrects stored images: gives attributes other values and notes that in the images, or moves images from another
/// study here. `jobXml` says what changes, `studyUID` is the study, `images` are `count` SOP Instance UIDs.
/// `cacheEntries` are `count` names in the file cache; null for none. Those with "Level1" in their names are removed
/// from it when the correction is done.
///
/// False when the job cannot be understood or a tag file cannot be held, read or written.
KDD_EXPORT bool UpdateTagFile(const char* jobXml, const char* studyUID, int count, const char** images,
                              const char** cacheEntries);

/// The same with wide texts. Whatever encoding the XML declares, its text is the text that is given.
KDD_EXPORT bool UpdateTagFileW(const wchar_t* jobXml, const wchar_t* studyUID, int count,
                               const wchar_t** images, const wchar_t** cacheEntries);

/// Reads a study's tag file, brings it into line with the image database and hands out the result in the format of a
/// tag file: `*size` bytes at `*data`. The file on disk stays as it is. `user` is who asks, for databases that want
/// to know; may be null.
///
/// The handle owns the bytes: both are valid until it is given to `FreeTagFileData`. Null, with size 0 and data null,
/// when the database does not know the study or the file cannot be read.
KDD_EXPORT void* ReadAndSyncTagFileData(const char* studyUID, const char* user, unsigned int* size,
                                        const char** data);

/// Frees what `ReadAndSyncTagFileData` handed out; null is ignored.
KDD_EXPORT void FreeTagFileData(void* handle);

// NOLINTEND(readability-identifier-naming)

#ifdef __cplusplus
}
#endif
