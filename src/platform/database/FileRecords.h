#pragma once

#include <QByteArray>
#include <QMap>
#include <QSet>

#include <vector>

namespace Kxg
{

/// Longer ones are refused [bytes]. PostgreSQL indexes keys up to some 2,700 bytes; held for both engines, so that a
/// site can change to the other one.
constexpr int kMaxPath = 2600;
constexpr int kMaxUID = 256;

/// By what a file is recognised as unchanged.
struct FileStamp
{
    qint64 size = 0;      ///< [bytes]
    qint64 modified = 0;  ///< [ns] since the epoch

    bool operator==(const FileStamp& other) const { return size == other.size && modified == other.modified; }
};

/// What the database keeps of a DICOM file. Texts are UTF-8, trailing padding removed; paths are bytes as the operating
/// system has them.
struct DicomFileRecord
{
    QByteArray path;
    FileStamp stamp;
    QByteArray studyInstanceUID;  ///< any of the three may be empty
    QByteArray seriesInstanceUID;
    QByteArray sopInstanceUID;
    bool isDamaged =
        false;  ///< a strict reader refuses it; it was taken nevertheless, for what is sound of it

    // of the study
    QByteArray patientName;
    QByteArray patientID;
    QByteArray patientBirthDate;
    QByteArray patientSex;
    QByteArray studyDate;
    QByteArray studyTime;
    QByteArray studyDescription;
    QByteArray accessionNumber;

    // of the series
    QByteArray seriesNumber;
    QByteArray seriesDescription;
    QByteArray modality;
    QByteArray seriesDate;
    QByteArray seriesTime;
    QByteArray stationName;
};

struct VolumeFileRecord
{
    QByteArray path;
    FileStamp stamp;
    QByteArray studyInstanceUID;
    QByteArray seriesInstanceUID;
};

/// A file that was looked at and is neither.
struct OtherFileRecord
{
    QByteArray path;
    FileStamp stamp;
};

struct FileRecords
{
    std::vector<DicomFileRecord> dicom;
    std::vector<VolumeFileRecord> volumes;
    std::vector<OtherFileRecord> others;
};

/// Two files that name the same image, or an image that is not shown where its file says.
struct FileConflict
{
    enum class Kind {
        Replaces,           ///< `path` is shown in place of `otherPath`, which was registered before it
        AlsoInOtherStudy,   ///< `otherStudyUID` shows an image of the same SOP Instance UID, from `otherPath`
        FollowsCorrection,  ///< a correction moved the image to `otherStudyUID`, and the file goes there
    };

    Kind kind = Kind::Replaces;
    QByteArray path;
    QByteArray sopInstanceUID;
    QByteArray
        studyInstanceUID;  ///< in which `path` is registered; of one that follows, the one that it names itself
    QByteArray otherPath;
    QByteArray otherStudyUID;
};

/// What became of files that were registered.
struct RegistrationOutcome
{
    /// The request left for each study touched, by Study Instance UID. A study that lost its last file has one too: its
    /// tag file has to go.
    QMap<QByteArray, qint64> requests;
    std::vector<FileConflict> conflicts;

    /// The paths of those that a correction has shown as something else than they say themselves.
    QSet<QByteArray> corrected;
};

}  // namespace Kxg
