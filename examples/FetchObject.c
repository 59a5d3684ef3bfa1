/* Fetches an object of the network into a file, block by block, and holds its length against what the server said. */

#include <inttypes.h>
#include <kddlib/kddstream.h>
#include <stdio.h>

enum { BLOCK_SIZE = 65536 };

/* How many bytes came; less than the object has when the transfer or the file fails. */
static uint64_t copy(void* stream, FILE* file)
{
    static char block[BLOCK_SIZE];
    uint64_t total = 0;
    int32_t count = BLOCK_SIZE;
    while (count == BLOCK_SIZE) {
        count = ReadBytes(stream, block, 0, BLOCK_SIZE);
        if (fwrite(block, 1, (size_t)count, file) != (size_t)count)
            break;
        total += (uint64_t)count;
    }
    return total;
}

static int fetch(const char* url, FILE* file)
{
    void* stream = NULL;
    uint64_t length = 0;
    uint64_t got = 0;
    if (OpenStream(url, &stream) != KDD_STREAM_OPENED)
        return 1;
    length = StreamContentLength(stream);
    got = copy(stream, file);
    CloseStream(stream);
    printf("%" PRIu64 " of %" PRIu64 " bytes\n", got, length);
    return got == length ? 0 : 1;
}

int main(int argc, char* argv[])
{
    FILE* file = NULL;
    int result = 0;
    if (argc != 3 || !StringIsUrl(argv[1])) {
        fprintf(stderr, "usage: FetchObject URL FILE\n");
        return 2;
    }
    file = fopen(argv[2], "wb");
    if (file == NULL) {
        perror(argv[2]);
        return 1;
    }
    result = fetch(argv[1], file);
    return fclose(file) == 0 ? result : 1;
}
