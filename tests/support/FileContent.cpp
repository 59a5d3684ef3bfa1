#include "support/FileContent.h"

#include <QDir>
#include <QDirIterator>
#include <QFile>
#include <QFileInfo>
#include <QtEndian>

#include <fcntl.h>
#include <libdeflate.h>
#include <sys/stat.h>
#include <unistd.h>

namespace Kdd
{

void putFile(const QString& path, const QByteArray& content)
{
    QDir().mkpath(QFileInfo(path).path());
    QFile file(path);
    ASSERT_TRUE(file.open(QIODevice::WriteOnly));
    ASSERT_EQ(file.write(content), content.size());
}

QByteArray fileContent(const QString& path)
{
    QFile file(path);
    return file.open(QIODevice::ReadOnly) ? file.readAll() : QByteArray("(no file)");
}

QStringList filesBelow(const QString& folder, const QStringList& patterns)
{
    QStringList files;
    QDirIterator all(folder, patterns, QDir::Files | QDir::Hidden, QDirIterator::Subdirectories);
    while (all.hasNext())
        files.append(all.next());
    files.sort();
    return files;
}

void flipBit(const QString& path, qint64 byte, Clock clock)
{
    const int file = ::open(path.toUtf8().constData(), O_RDWR | O_CLOEXEC);
    struct stat status = {};
    char bits = 0;
    ASSERT_EQ(::fstat(file, &status), 0) << path.toStdString();
    ASSERT_EQ(::pread(file, &bits, 1, byte), 1);
    bits = static_cast<char>(bits ^ (1 << (byte % 8)));
    ASSERT_EQ(::pwrite(file, &bits, 1, byte), 1);
    const timespec times[2] = {status.st_atim, status.st_mtim};
    if (clock == Clock::Kept) {
        ASSERT_EQ(::futimens(file, times), 0);
    }
    ::close(file);
}

QByteArray journalOf(const QByteArray& content)
{
    QByteArray bytes("KDDJRNL1............");
    const auto size = static_cast<size_t>(content.size());
    qToLittleEndian(quint64{size}, bytes.data() + 8);
    qToLittleEndian(libdeflate_crc32(0, content.constData(), size), bytes.data() + 16);
    return bytes + content;
}

}  // namespace Kdd
