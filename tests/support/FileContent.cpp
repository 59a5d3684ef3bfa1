#include "support/FileContent.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>
#include <QtEndian>

#include <libdeflate.h>

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

QByteArray journalOf(const QByteArray& content)
{
    QByteArray bytes("KDDJRNL1............");
    const auto size = static_cast<size_t>(content.size());
    qToLittleEndian(quint64{size}, bytes.data() + 8);
    qToLittleEndian(libdeflate_crc32(0, content.constData(), size), bytes.data() + 16);
    return bytes + content;
}

}  // namespace Kdd
