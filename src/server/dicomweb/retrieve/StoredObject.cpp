#include "server/dicomweb/retrieve/StoredObject.h"

#include <cstring>

namespace Kdd::DicomWeb
{

void StoredObject::append(const QVector<FileStretch>& stretches, std::vector<Http::BodyPart>& body) const
{
    for (const FileStretch& stretch : stretches) {
        if (stretch.length > 0)
            body.push_back(part(stretch));
    }
}

qint64 LocalObject::read(qint64 offset, char* out, qint64 length)
{
    const qint64 count = qBound<qint64>(0, size() - offset, length);
    QByteArray bytes;
    if (offset < 0 || mFile->read(offset, count, bytes).bad())
        return -1;
    std::memcpy(out, bytes.constData(), static_cast<size_t>(count));
    return count;
}

Http::BodyPart LocalObject::part(const FileStretch& stretch) const
{
    return Http::FileRange{mFile, stretch.offset, stretch.length};
}

qint64 MemoryObject::read(qint64 offset, char* out, qint64 length)
{
    if (offset < 0)
        return -1;
    const qint64 count = qBound<qint64>(0, size() - offset, length);
    std::memcpy(out, mBytes.constData() + offset, static_cast<size_t>(count));
    return count;
}

Http::BodyPart MemoryObject::part(const FileStretch& stretch) const
{
    return mBytes.mid(static_cast<int>(stretch.offset), static_cast<int>(stretch.length));
}

}  // namespace Kdd::DicomWeb
