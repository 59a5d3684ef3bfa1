#pragma once

#include <QByteArray>
#include <QJsonObject>
#include <QVector>

namespace Kdd
{

class TagFile;

}  // namespace Kdd

namespace Kdd::Browser
{

/// Where the DICOM files of the images lie, and what the attributes that are kept of them would take if each file had its
/// own [bytes], as in Explicit VR Little Endian.
struct StudyFiles
{
    QVector<QByteArray> paths;
    qint64 attributeBytes = 0;
};

StudyFiles filesOf(const TagFile& file);

/// The files that are there now, added up:
///
///     {"files": 120, "missing": 0, "dicom": 63000000, "attributes": 240000}
QJsonObject sizesJson(const StudyFiles& files);

}  // namespace Kdd::Browser
