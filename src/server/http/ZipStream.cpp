#include "server/http/ZipStream.h"

#include <QtEndian>

#include <libdeflate.h>

namespace Kdd::Http
{

namespace
{

constexpr quint16 kVersionLarge = 45;       // that knows 64-bit sizes
constexpr quint16 kSizesFollow = 1U << 3U;  // behind the file
constexpr quint16 kDate =
    (1U << 5U) | 1U;  // the first day there is: what is made on request has no date of its own
constexpr quint32 kEscape = 0xffffffff;  // the value stands in the extra field
constexpr quint16 kLargeField = 0x0001;

class Record
{
public:
    explicit Record(quint32 signature) { put(signature); }

    template <typename Number>
    Record& put(Number value)
    {
        char bytes[sizeof value];
        qToLittleEndian(value, bytes);
        mBytes.append(bytes, sizeof value);
        return *this;
    }

    Record& put16(int value) { return put(static_cast<quint16>(value)); }
    Record& text(const QByteArray& text)
    {
        mBytes += text;
        return *this;
    }
    const QByteArray& bytes() const { return mBytes; }

private:
    QByteArray mBytes;
};

quint32 shortened(quint64 value)
{
    return value >= kEscape ? kEscape : static_cast<quint32>(value);
}

}  // namespace

QByteArray ZipStream::counted(const QByteArray& bytes)
{
    mWritten += static_cast<quint64>(bytes.size());
    return bytes;
}

/// Sizes are escaped always: they are not known yet, and a field for them in the header says that 64 bits of each follow
/// behind the file.
QByteArray ZipStream::begin(const QByteArray& name, const QByteArray&)
{
    mEntries.push_back({name, mWritten, 0, 0});
    Record header(0x04034b50);
    header.put(kVersionLarge).put(kSizesFollow).put16(0).put16(0).put(kDate);
    header.put(quint32(0)).put(kEscape).put(kEscape).put16(name.size()).put16(20).text(name);
    header.put(kLargeField).put16(16).put(quint64(0)).put(quint64(0));
    return counted(header.bytes());
}

void ZipStream::pass(const QByteArray& bytes)
{
    Entry& entry = mEntries.back();
    entry.checksum = libdeflate_crc32(entry.checksum, bytes.constData(), static_cast<size_t>(bytes.size()));
    entry.size += static_cast<quint64>(bytes.size());
    mWritten += static_cast<quint64>(bytes.size());
}

QByteArray ZipStream::end()
{
    const Entry& entry = mEntries.back();
    return counted(Record(0x08074b50).put(entry.checksum).put(entry.size).put(entry.size).bytes());
}

QByteArray ZipStream::directoryOf(const Entry& entry)
{
    const bool isLarge = entry.size >= kEscape || entry.offset >= kEscape;
    Record record(0x02014b50);
    record.put(kVersionLarge).put(kVersionLarge).put(kSizesFollow).put16(0).put16(0).put(kDate);
    record.put(entry.checksum).put(isLarge ? kEscape : shortened(entry.size));
    record.put(isLarge ? kEscape : shortened(entry.size)).put16(entry.name.size()).put16(isLarge ? 28 : 0);
    record.put16(0).put16(0).put16(0).put(quint32(0)).put(isLarge ? kEscape : shortened(entry.offset));
    record.text(entry.name);
    if (isLarge)
        record.put(kLargeField).put16(24).put(entry.size).put(entry.size).put(entry.offset);
    return record.bytes();
}

QByteArray ZipStream::finish()
{
    const quint64 start = mWritten;
    QByteArray directory;
    for (const Entry& entry : mEntries)
        directory += directoryOf(entry);
    const auto size = static_cast<quint64>(directory.size());
    const quint64 count = mEntries.size();
    const bool isLarge = count >= 0xffff || start >= kEscape || size >= kEscape;
    if (isLarge) {
        directory += Record(0x06064b50).put(quint64(44)).put(kVersionLarge).put(kVersionLarge).bytes();
        directory += Record(0).put(quint32(0)).put(count).put(count).put(size).put(start).bytes();
        directory += Record(0x07064b50).put(quint32(0)).put(start + size).put(quint32(1)).bytes();
    }
    const int shown = count >= 0xffff ? 0xffff : static_cast<int>(count);
    directory += Record(0x06054b50).put16(0).put16(0).put16(shown).put16(shown).put(shortened(size)).bytes();
    directory += Record(shortened(start)).put16(0).bytes();
    return counted(directory);
}

}  // namespace Kdd::Http
