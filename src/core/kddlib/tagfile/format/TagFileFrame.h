#pragma once

#include "kddlib/tagfile/format/FileSizes.h"

#include <QByteArray>
#include <QList>

namespace Kdd
{

// What the writer and the reader of a tag file share; docs/tag-file-format.md has all of it.

constexpr char kMagic[] = {'T', 'a', 'C', 'a'};
constexpr quint8 kVersion = 0;
constexpr quint8 kOldLayout = 1;
constexpr quint8 kLayout = 2;

constexpr int kFrameSize = 16;  // header, body size and blob count
constexpr int kBlobFrameSize = 4;

// What the records of a body hold.
constexpr quint8 kStudyRecord = 0;
constexpr quint8 kSeriesRecord = 1;
constexpr quint8 kImageRecord = 2;
constexpr quint8 kVolumesRecord = 3;

/// All of a file but its body [bytes].
qint64 sizeAround(const QList<QByteArray>& blobs);

/// Of a file whose body has these sizes, as it is stored and before it was compressed [bytes].
void recordSizes(qint64 storedBody, qint64 body, const QList<QByteArray>& blobs, FileSizes& sizes);

}  // namespace Kdd
