#pragma once

#include "platform/base/Export.h"
#include "platform/base/Result.h"

#include <QByteArray>
#include <QHash>
#include <QMap>
#include <QSet>
#include <QVector>

#include <memory>
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

/// A line of the list of studies.
struct StudySummary
{
    int id = 0;
    QByteArray studyInstanceUID;
    QByteArray patientName;
    QByteArray patientID;
    QByteArray studyDate;
    QByteArray modalities;  ///< distinct, sorted, separated by a blank
    int series = 0;
    int images = 0;
    int volumes = 0;
    bool isWaiting = false;  ///< something changed since its tag file was built
};

/// The right to build one study's tag file, which one holder has at a time among all processes and machines. It ends
/// with the object, and also when its process dies. The catalogue it came from must outlive it.
class KDD_EXPORT StudyClaim
{
public:
    virtual ~StudyClaim() = default;
    StudyClaim(const StudyClaim&) = delete;
    StudyClaim& operator=(const StudyClaim&) = delete;

    virtual int studyId() const = 0;
    virtual const QByteArray& studyInstanceUID() const = 0;

    /// Takes the study off the queue: the requests that were there when it was claimed are done. Requests that came
    /// meanwhile stay.
    virtual Kdd::Result finish() = 0;

protected:
    StudyClaim() = default;
};

/// The side of the image database that changes it: registering and removing files, the queue of studies that wait to be
/// built, configuration.
///
/// The queue holds requests. Every transaction that registers or removes files leaves one request for each study it
/// touched; the study waits as long as a request of it is there. Whoever has done the work deletes the requests that he
/// knows of, so that what is registered while a study is being built makes it wait again.
///
/// One object is one connection and belongs to the thread that opened it. Every failure leaves the database as it was
/// and tells why: the database and what it said.
class KDD_EXPORT Catalogue
{
public:
    /// Makes the database or brings its schema up to date. A schema newer than this program is refused.
    static std::unique_ptr<Catalogue> open(const QByteArray& address, Kdd::Result& result);

    virtual ~Catalogue() = default;
    Catalogue(const Catalogue&) = delete;
    Catalogue& operator=(const Catalogue&) = delete;

    // ---- files

    /// The files known at or below a path (a file or a folder), with their stamps.
    virtual Kdd::Result knownFiles(const QByteArray& path, QHash<QByteArray, FileStamp>& stamps) = 0;

    /// Registers the files in one transaction, in place of what was known under their paths; `requests` receives the
    /// request left for each study touched, by Study Instance UID. A file that moves from one study to another
    /// touches both. One file that is refused refuses them all.
    virtual Kdd::Result registerFiles(const FileRecords& files, QMap<QByteArray, qint64>& requests) = 0;

    /// Forget files; the files themselves stay. Studies and series that become empty go too.
    virtual Kdd::Result removeFiles(const QVector<QByteArray>& paths) = 0;
    virtual Kdd::Result removeStudy(const QByteArray& studyUID) = 0;
    virtual Kdd::Result removeSeries(const QByteArray& studyUID, const QByteArray& seriesUID) = 0;
    virtual Kdd::Result removeImage(const QByteArray& studyUID, const QByteArray& sopUID) = 0;

    // ---- studies

    /// By UID.
    virtual Kdd::Result listStudies(std::vector<StudySummary>& studies) = 0;

    /// At most `limit` UIDs that begin with `prefix`, in order.
    virtual Kdd::Result findStudies(const QByteArray& prefix, int limit, QVector<QByteArray>& studyUIDs) = 0;

    /// The volume files of a study, by part number and path.
    virtual Kdd::Result volumeFiles(const QByteArray& studyUID, QVector<QByteArray>& paths) = 0;

    // ---- the queue

    /// Leaves a request for each of the studies; one that does not exist is a failure that names it.
    virtual Kdd::Result requestBuild(const QVector<QByteArray>& studyUIDs) = 0;

    /// The UIDs of the studies that wait, claimed ones included, and have files at or below a path; in order.
    virtual Kdd::Result waitingStudies(const QByteArray& path, QVector<QByteArray>& studyUIDs) = 0;

    /// Studies that wait, claimed ones included.
    virtual Kdd::Result countWaiting(int& studies) = 0;

    /// Claims the study that waits longest, of those that nobody holds and that are not in `except` (study ids). Null
    /// in `claim` when there is none.
    virtual Kdd::Result claimNext(const QSet<int>& except, std::unique_ptr<StudyClaim>& claim) = 0;

    /// Claims one study, whether it waits or not, and waits up to `patienceMs` [ms] while another holds it. Null in
    /// `claim` when it is still held then; a study that does not exist is a failure.
    virtual Kdd::Result claim(const QByteArray& studyUID, int patienceMs,
                              std::unique_ptr<StudyClaim>& claim) = 0;

    /// Deletes requests that are done, whoever left them.
    virtual Kdd::Result finishRequests(const QVector<qint64>& requests) = 0;

    // ---- configuration

    virtual Kdd::Result setConfig(const QByteArray& section, const QByteArray& key,
                                  const QByteArray& value) = 0;

protected:
    Catalogue() = default;
};

}  // namespace Kxg
