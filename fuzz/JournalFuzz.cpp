// Whatever lies in a file's journal, recovery leaves no journal, and the file as it was; or, when the journal is
// complete, the file with exactly its content.

#include "fuzz/Property.h"
#include "platform/os/ExclusiveFile.h"
#include "platform/os/JournaledWrite.h"

#include <QFile>
#include <QTemporaryDir>
#include <QtEndian>

#include <libdeflate.h>

using namespace Kdd;

namespace
{

constexpr int kLengthAt = 8;
constexpr int kChecksumAt = 16;
constexpr int kHeaderSize = 20;

const QByteArray kFormer("what the file held before its writer came to an untimely end");

void put(const QString& path, const QByteArray& bytes)
{
    QFile file(path);
    require(file.open(QIODevice::WriteOnly) && file.write(bytes) == bytes.size(), "the file can be made");
}

bool isComplete(const QByteArray& journal)
{
    if (!journal.startsWith("KDDJRNL1") || journal.size() < kHeaderSize)
        return false;
    const auto length = static_cast<std::size_t>(journal.size() - kHeaderSize);
    return qFromLittleEndian<quint64>(journal.constData() + kLengthAt) == length &&
           qFromLittleEndian<quint32>(journal.constData() + kChecksumAt) ==
               libdeflate_crc32(0, journal.constData() + kHeaderSize, length);
}

/// The file is not cut: what is behind a shorter content stays.
QByteArray expected(const QByteArray& journal)
{
    const QByteArray content = journal.mid(kHeaderSize);
    return isComplete(journal) ? content + kFormer.mid(content.size()) : kFormer;
}

QByteArray recovered(const QString& path)
{
    QFile file;
    require(bool(openLockedFile(file, path, FileLock::Exclusive, IfAbsent::Fail, {1, 0})),
            "the file can be locked");
    require(recoverInterruptedWrite(file, path, Flush::Process).good(), "the file can be recovered");
    return file.readAll();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, std::size_t size)
{
    static const QTemporaryDir folder;
    const QString path = folder.filePath(QStringLiteral("file"));
    const QByteArray journal = bytesOf(data, size);
    put(path, kFormer);
    put(journalPath(path), journal);

    require(recovered(path) == expected(journal), "the file is old or new, as the journal says");
    require(!hasJournal(path), "the journal is gone");
    return 0;
}
