#pragma once

#include <QByteArray>
#include <QVector>

#include <memory>
#include <vector>

namespace Kxg
{

/// One image of a series: its SOP Instance UID and where its file lies.
struct ImageFile
{
    QByteArray sopInstanceUID;
    QByteArray path;
};

/// The images of one series, in the order of their paths.
struct SeriesInfo
{
    QByteArray seriesInstanceUID;
    std::vector<ImageFile> images;
};

/// One line of the database's directory: a study with its series below it, a series with its volume files below it, or
/// a file. All texts are UTF-8. Fields that a kind of entry does not have are empty.
struct DicomDirectoryEntry
{
    enum Type { StudyEntry = 0, DicomFile = 1, SeriesEntry = 2, VolumeFile = 3 };

    /// Bits of `flags`.
    enum Flag : unsigned { HasVolume = 4 };

    int type = StudyEntry;
    unsigned flags = 0;

    /// Of a file: its name without folder.
    QByteArray name;

    QByteArray studyInstanceUID;
    QByteArray seriesInstanceUID;
    QByteArray seriesNumber;
    QByteArray seriesDescription;
    QByteArray modality;
    QByteArray seriesDate;  ///< YYYYMMDD
    QByteArray seriesTime;  ///< HH:MM:SS.ffffff or as DICOM has it
    QByteArray stationName;

    /// Of a series, once asked for (`GetSeries`).
    std::shared_ptr<SeriesInfo> seriesInfo;

    /// What lies below: ordered by UID (series), by part number and then name (files).
    std::vector<DicomDirectoryEntry> entries;
};

}  // namespace Kxg
