// In place of the fuzzer: runs a target once with each file at or below the arguments.

#include <QDirIterator>
#include <QFile>
#include <QFileInfo>
#include <QStringList>

#include <cstddef>
#include <cstdint>
#include <cstdio>

extern "C" int LLVMFuzzerInitialize(int* argc, char*** argv);
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, std::size_t size);

namespace
{

QStringList filesAt(const QString& path)
{
    if (QFileInfo(path).isFile())
        return {path};
    QStringList files;
    QDirIterator below(path, QDir::Files, QDirIterator::Subdirectories);
    while (below.hasNext())
        files.append(below.next());
    files.sort();
    return files;
}

bool replay(const QString& path)
{
    QFile file(path);
    if (!file.open(QIODevice::ReadOnly)) {
        std::fprintf(stderr, "Could not open %s\n", qUtf8Printable(path));
        return false;
    }
    const QByteArray bytes = file.readAll();
    std::printf("%s\n", qUtf8Printable(path));
    std::fflush(stdout);  // the last line names the culprit when the target ends the process
    LLVMFuzzerTestOneInput(reinterpret_cast<const uint8_t*>(bytes.constData()),
                           static_cast<std::size_t>(bytes.size()));
    return true;
}

}  // namespace

int main(int argc, char* argv[])
{
    LLVMFuzzerInitialize(&argc, &argv);
    int replayed = 0;
    for (int i = 1; i < argc; ++i) {
        for (const QString& path : filesAt(QString::fromLocal8Bit(argv[i]))) {
            if (!replay(path))
                return 1;
            ++replayed;
        }
    }
    // A folder that was moved away must not look like a test that passes.
    if (replayed == 0)
        std::fprintf(stderr, "There are no files to replay\n");
    return replayed > 0 ? 0 : 1;
}
