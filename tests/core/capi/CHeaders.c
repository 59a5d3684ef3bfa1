/* What C programs rely on: the headers are plain C, and the functions have these types. */

#include <kddlib/kddstream.h>
#include <kddlib/kddtagfile.h>

void (*const kddConfigureLogging)(short, const char*) = ConfigureLogging;
bool (*const kddRemovals[])(const char*, int, const char**) = {DeleteImagesInTagFile, DeleteSeriesInTagFile};
bool (*const kddUpdate)(const char*, const char*, int, const char**, const char**) = UpdateTagFile;
bool (*const kddUpdateW)(const wchar_t*, const wchar_t*, int, const wchar_t**,
                         const wchar_t**) = UpdateTagFileW;
void* (*const kddSync)(const char*, const char*, unsigned int*, const char**) = ReadAndSyncTagFileData;
void (*const kddFrees[])(void*) = {FreeTagFileData, CloseStream, DeleteUserInfo};
int (*const kddOpen)(const char*, void**) = OpenStream;
int (*const kddOpenRange)(const char*, const char*, void**) = OpenStreamRange;
int32_t (*const kddRead)(void*, void*, int32_t, int32_t) = ReadBytes;
uint64_t (*const kddLength)(void*) = StreamContentLength;
void* (*const kddCreate)(void) = CreateUserInfo;
int (*const kddReadDicom)(const char*, void*, uint32_t*, const char**, int32_t, uint32_t*) = ReadDicomFromUrl;
bool (*const kddQuestions[])(const char*) = {DeleteTagFile, DeleteObject, StringIsUrl};
int (*const kddVideo)(const char*, char*, int32_t*, int32_t*, uint64_t*, uint64_t*) = GetVideoMetaInfo;
