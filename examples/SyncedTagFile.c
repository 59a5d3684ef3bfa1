/* Writes the tag file of a study to a file as the image database has it now; the tag file itself stays as it is. */

#include <kddlib/kddtagfile.h>
#include <stdio.h>

enum { DEBUG_TO_STANDARD_ERROR = 1 };

static int save(const char* name, const char* data, size_t size)
{
    FILE* file = fopen(name, "wb");
    int isWritten = 0;
    if (file == NULL)
        return 0;
    isWritten = fwrite(data, 1, size, file) == size;
    return fclose(file) == 0 && isWritten;
}

int main(int argc, char* argv[])
{
    unsigned int size = 0;
    const char* data = NULL;
    void* handle = NULL;
    int isSaved = 0;
    if (argc != 4) {
        fprintf(stderr, "usage: SyncedTagFile DATABASE STUDY_INSTANCE_UID FILE\n");
        return 2;
    }
    ConfigureLogging(DEBUG_TO_STANDARD_ERROR, argv[1]);
    handle = ReadAndSyncTagFileData(argv[2], NULL, &size, &data);
    if (handle == NULL)
        return 1;
    isSaved = save(argv[3], data, size);
    FreeTagFileData(handle);
    printf("%u bytes\n", size);
    return isSaved ? 0 : 1;
}
