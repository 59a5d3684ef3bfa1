/* What C programs rely on: the headers are plain C, and the functions have these types. */

#include <kddlib/capi/kddstream.h>
#include <kddlib/capi/kddtagfile.h>

struct KddFunctions
{
    void (*configureLogging)(short, const char*);
    bool (*removals[2])(const char*, int, const char**);
    bool (*deleteTagFile)(const char*);
    bool (*update)(const char*, const char*, int, const char**, const char**);
    bool (*updateW)(const wchar_t*, const wchar_t*, int, const wchar_t**, const wchar_t**);
    void* (*readAndSync)(const char*, const char*, unsigned int*, const char**);
    void (*frees[3])(void*);
    int (*open)(const char*, void**);
    int (*openRange)(const char*, const char*, void**);
    int32_t (*read)(void*, void*, int32_t, int32_t);
    uint64_t (*length)(void*);
    void* (*create)(void);
    int (*readDicom)(const char*, void*, uint32_t*, const char**, int32_t, uint32_t*);
    bool (*questions[2])(const char*);
    int (*video)(const char*, char*, int32_t*, int32_t*, uint64_t*, uint64_t*);
};

const struct KddFunctions kddFunctions = {
    ConfigureLogging,
    {DeleteImagesInTagFile, DeleteSeriesInTagFile},
    DeleteTagFile,
    UpdateTagFile,
    UpdateTagFileW,
    ReadAndSyncTagFileData,
    {FreeTagFileData, CloseStream, DeleteUserInfo},
    OpenStream,
    OpenStreamRange,
    ReadBytes,
    StreamContentLength,
    CreateUserInfo,
    ReadDicomFromUrl,
    {DeleteObject, StringIsUrl},
    GetVideoMetaInfo,
};
