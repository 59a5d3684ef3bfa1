#pragma once

#include "platform/base/Export.h"
#include "platform/base/IfAbsent.h"
#include "platform/base/Result.h"
#include "platform/database/FileRecords.h"
#include "platform/database/SearchRecord.h"
#include "platform/database/TagFileStamp.h"

#include <QByteArray>
#include <QHash>
#include <QMap>
#include <QSet>
#include <QVector>

#include <memory>
#include <vector>

namespace Kxg
{

struct CheckedStudy;
struct FileDigest;
class CheckTurn;
struct TagFileProofs;

/// A correction of one stored image: what its study shows of it in place of what its DICOM file says. An image has one,
/// which holds all that was ever corrected.
struct ImageCorrection
{
    QByteArray studyInstanceUID;  ///< as the DICOM file has it
    QByteArray image;             ///< its SOP Instance UID likewise, or the file's path where it has none

    QByteArray shownStudyUID;   ///< where the image stands now
    QByteArray shownSeriesUID;  ///< empty: the one that the file says
    QByteArray shownImage;      ///< its SOP Instance UID now, or the path

    /// The attributes that are replaced, as whoever corrects encodes them. Empty: there is no correction any more.
    QByteArray changes;
};

/// An image of a study: of several files of one SOP Instance UID the one registered last.
struct ListedImage
{
    QByteArray path;
    QByteArray seriesInstanceUID;
    QByteArray sopInstanceUID;  ///< as it is shown; empty where the file has none

    /// Under which tag files know it.
    const QByteArray& key() const { return sopInstanceUID.isEmpty() ? path : sopInstanceUID; }
};

/// A file of an image, where the image is shown now.
struct KeptFile
{
    QByteArray path;
    bool isShown = false;  ///< of several files the one that counts
    QByteArray shownStudyUID;
    QByteArray shownSeriesUID;
    QByteArray shownImage;
};

/// All that the catalogue has of one study.
struct StudyContents
{
    int id = 0;                       ///< 0: there is no such study
    std::vector<ListedImage> images;  ///< by path
    QVector<QByteArray> volumes;  ///< volume files, by path, those that a correction brought along included
    bool isCorrected = false;     ///< a correction concerns an image that is or was in the study
    bool isWaiting = false;       ///< something changed since its tag file was built
    QVector<qint64> changes;      ///< the requests left by what changed; what only has to settle leaves none
    TagFileStamp tagFile;
};

/// A study whose tag file was brought into line with the catalogue.
struct BuiltStudy
{
    TagFileStamp tagFile;

    /// An image of each series, corrections included, from which the series' attributes are taken; of the first one
    /// also those of the study.
    std::vector<DicomFileRecord> series;

    /// What searches know of it from now on.
    StudySearchRecord search;

    /// Other than by what arrived, left or was corrected: others are not told of it.
    bool isOnlyRearranged = false;

    /// Of images that a correction moved: where they were and are. Empty: none was.
    QByteArray movedFrom;
    QByteArray movedTo;

    /// When the tag file is to be built once more although nothing changed [ms since the epoch]; 0: not at all. Until
    /// then the study does not wait.
    qint64 settleAt = 0;

    /// Whether the requests noted are done; else the study goes on waiting if it did.
    bool isComplete = true;
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
    int images = 0;  ///< not files: several files of one image are one
    int volumes = 0;
    bool isWaiting = false;  ///< something changed since its tag file was built
    TagFileStamp tagFile;
};

/// The right to build one study's tag file, which one holder has at a time among all processes and machines. It ends
/// with the object, and also when its process dies. The catalogue it came from must outlive it. Used by the thread of
/// that.
class KDD_EXPORT StudyClaim
{
public:
    virtual ~StudyClaim() = default;
    StudyClaim(const StudyClaim&) = delete;
    StudyClaim& operator=(const StudyClaim&) = delete;

    virtual int studyId() const = 0;
    virtual const QByteArray& studyInstanceUID() const = 0;

    /// Notes the requests that are there now, for whoever begins the work only now or has changed the study himself
    /// since he claimed it.
    virtual Kdd::Result noteRequests() = 0;

    /// Takes the study off the queue: the requests that were there when it was claimed, or when they were noted last,
    /// are done. Requests that came meanwhile stay.
    virtual Kdd::Result finish() = 0;

    /// The same, and keeps what the study now shows of itself and by what its tag file is recognised.
    virtual Kdd::Result finish(const BuiltStudy& built) = 0;

    /// Keeps the same of a study whose tag file was changed in one respect, and takes back the one request that this
    /// change left. Other requests stay: what they ask for is still to be done.
    virtual Kdd::Result finishChange(const BuiltStudy& built, qint64 request) = 0;

    /// Keeps only what searches know of the study, whose tag file may lack more than what was done to it now: the study
    /// goes on waiting.
    virtual Kdd::Result noteSearch(const BuiltStudy& built) = 0;

    /// As `finish` for a study that has neither files nor a tag file any more: forgets it, unless it got files meanwhile.
    virtual Kdd::Result finishRemoved() = 0;

protected:
    StudyClaim() = default;
};

/// The side of the image database that changes it: registering and removing files, the queue of studies that wait to be
/// built, configuration.
///
/// The queue holds requests. Every transaction that registers or removes files leaves one request for each study it
/// touched; the study waits as long as a request of it is due. Whoever has done the work deletes the requests that he
/// knows of, so that what is registered while a study is being built makes it wait again. A study that lost its last
/// file waits as well, until its tag file is removed and somebody says so; lists do not show it.
///
/// Files are listed where their images are shown: under the study, series and SOP Instance UID that a correction gave
/// them. Of several files of one image in a study the one registered last counts, and the next one when that goes.
///
/// One object is one connection and belongs to the thread that opened it. Every failure leaves the database as it was
/// and tells why: the database and what it said.
class KDD_EXPORT Catalogue
{
public:
    /// Makes the database or brings its schema up to date. A schema newer than this program is refused. One that this
    /// process had open is not made a second time: its absence is a failure then.
    static std::unique_ptr<Catalogue> open(const QByteArray& address, Kdd::Result& result);

    /// The same, but one that does not exist is a failure. An SQLite database that this process may not change can be
    /// read.
    static std::unique_ptr<Catalogue> openExisting(const QByteArray& address, Kdd::Result& result);

    virtual ~Catalogue() = default;
    Catalogue(const Catalogue&) = delete;
    Catalogue& operator=(const Catalogue&) = delete;

    // ---- files

    /// The files known at or below a path (a file or a folder), with their stamps.
    virtual Kdd::Result knownFiles(const QByteArray& path, QHash<QByteArray, FileStamp>& stamps) = 0;

    /// Registers the files in one transaction, in place of what was known under their paths; `requests` receives the
    /// request left for each study touched, by Study Instance UID. A file that moves from one study to another
    /// touches both. One file that is refused refuses them all.
    Kdd::Result registerFiles(const FileRecords& files, QMap<QByteArray, qint64>& requests);

    /// The same, and tells which files stand in each other's way.
    virtual Kdd::Result registerFiles(const FileRecords& files, RegistrationOutcome& outcome) = 0;

    /// Forget files; the files themselves stay, and so do corrections: a file that comes back follows them. Series that
    /// become empty go too; a study that does waits for its tag file to be removed.
    virtual Kdd::Result removeFiles(const QVector<QByteArray>& paths) = 0;
    virtual Kdd::Result removeStudy(const QByteArray& studyUID) = 0;
    virtual Kdd::Result removeSeries(const QByteArray& studyUID, const QByteArray& seriesUID) = 0;
    virtual Kdd::Result removeImage(const QByteArray& studyUID, const QByteArray& sopUID) = 0;

    // ---- corrections

    /// Keeps the corrections in place of earlier ones of the same images, and lists the files of each image where it is
    /// shown now. `requests` receives a request for each study touched; one that does not exist yet is made.
    virtual Kdd::Result recordCorrections(const std::vector<ImageCorrection>& corrections,
                                          QMap<QByteArray, qint64>& requests) = 0;

    /// The corrections of images that are or were in a study.
    virtual Kdd::Result corrections(const QByteArray& studyUID,
                                    std::vector<ImageCorrection>& corrections) = 0;

    // ---- studies

    /// All that there is of a study, at one moment; nothing of one that does not exist.
    virtual Kdd::Result studyContents(const QByteArray& studyUID, StudyContents& contents) = 0;

    /// By UID, those that have files.
    virtual Kdd::Result listStudies(std::vector<StudySummary>& studies) = 0;

    /// At most `limit` UIDs that begin with `prefix`, in order.
    virtual Kdd::Result findStudies(const QByteArray& prefix, int limit, QVector<QByteArray>& studyUIDs) = 0;

    /// Whether there is a study of this UID.
    virtual Kdd::Result findStudy(const QByteArray& studyUID, bool& isThere) = 0;

    /// The volume files of a study, by part number and path.
    virtual Kdd::Result volumeFiles(const QByteArray& studyUID, QVector<QByteArray>& paths) = 0;

    // ---- the queue

    enum class IfGone { Fail, PassOver };

    /// Leaves a request for each of the studies; one that does not exist is a failure that names it, or is passed over.
    virtual Kdd::Result requestBuild(const QVector<QByteArray>& studyUIDs, IfGone ifGone = IfGone::Fail) = 0;

    /// Makes all requests due that wait for their time.
    virtual Kdd::Result settleNow() = 0;

    /// The UIDs of the studies that wait, claimed ones included, and have files at or below a path; in order.
    virtual Kdd::Result waitingStudies(const QByteArray& path, QVector<QByteArray>& studyUIDs) = 0;

    /// Studies that wait, claimed ones included.
    virtual Kdd::Result countWaiting(int& studies) = 0;

    /// Claims the study that waits longest, of those that nobody holds and that are not in `except` (study ids). Null
    /// in `claim` when there is none.
    virtual Kdd::Result claimNext(const QSet<int>& except, std::unique_ptr<StudyClaim>& claim) = 0;

    /// Claims one study, whether it waits or not, and waits up to `patienceMs` [ms] while another holds it. Null in
    /// `claim` when it is still held then; a study that does not exist is a failure, or is made without files.
    using IfAbsent = Kdd::IfAbsent;
    virtual Kdd::Result claim(const QByteArray& studyUID, int patienceMs, std::unique_ptr<StudyClaim>& claim,
                              IfAbsent ifAbsent = IfAbsent::Fail) = 0;

    /// Deletes requests that are done, whoever left them.
    virtual Kdd::Result finishRequests(const QVector<qint64>& requests) = 0;

    // ---- configuration

    virtual Kdd::Result setConfig(const QByteArray& section, const QByteArray& key,
                                  const QByteArray& value) = 0;

    // ---- single images

    /// The files of an image by the UIDs that these have themselves, wherever a correction has put it; the one
    /// registered last comes first.
    virtual Kdd::Result imageFiles(const QByteArray& studyUID, const QByteArray& sopUID,
                                   QVector<KeptFile>& files) = 0;

    // ---- several at work

    /// As `claimNext`, but leaves a study alone of which it is only known that new files came within the last `restMs`
    /// [ms]: whoever took them in has them at hand, and completes the study himself if he lives.
    virtual Kdd::Result claimRested(const QSet<int>& except, int restMs,
                                    std::unique_ptr<StudyClaim>& claim) = 0;

    /// The requests of a study that were left because files came that were not known before, and for nothing else.
    virtual Kdd::Result additions(const QByteArray& studyUID, QVector<qint64>& requests) = 0;

    /// Takes out of `paths` what is known, and what was removed and not registered again.
    virtual Kdd::Result dropKnown(QSet<QByteArray>& paths) = 0;

    /// Leaves a request for a study of which nothing changed, before its tag file is written all the same: whatever dies
    /// between that and the database leaves a study that waits.
    virtual Kdd::Result requestRewrite(const QByteArray& studyUID, qint64& request) = 0;

    // ---- what files are known by; StudyProofs.h

    /// All by which the tag file of a study is proven; nothing of one that does not exist.
    virtual Kdd::Result tagFileProofs(const QByteArray& studyUID, TagFileProofs& proofs) = 0;

    /// The DICOM and volume files of a study, by path, those included that are not shown.
    virtual Kdd::Result fileDigests(const QByteArray& studyUID, std::vector<FileDigest>& files) = 0;

    /// One file; without a path when it is not registered.
    virtual Kdd::Result fileDigest(const QByteArray& path, FileDigest& file) = 0;

    /// Keeps digests of files that are registered with the same size and time; of any other file nothing is kept.
    virtual Kdd::Result recordDigests(const std::vector<FileDigest>& digests) = 0;

    /// The study whose files were looked at the longest ago, of those before `before` [ms since the epoch]. No UID: there
    /// is none.
    virtual Kdd::Result nextToCheck(qint64 before, CheckedStudy& study) = 0;

    /// Keeps how far the look at a study has come; with `isDone` it is at its end at this moment.
    virtual Kdd::Result noteCheck(const CheckedStudy& study, bool isDone) = 0;

    /// Studies in whose files the last look found faults.
    virtual Kdd::Result countFaulty(int& studies) = 0;

    /// The right to look at the files of the archive in the background, which one process has at a time. Null in `turn`
    /// when another one has it.
    virtual Kdd::Result takeCheckTurn(std::unique_ptr<CheckTurn>& turn) = 0;

    /// The stamps of those of the paths that are known.
    virtual Kdd::Result stampsOf(const QList<QByteArray>& paths, QHash<QByteArray, FileStamp>& stamps) = 0;

    /// Whether the study has changes that its tag file does not show, has files below the folder, and nobody has tried in vain
    /// to build it since: a file could not be read.
    virtual Kdd::Result awaitsObjects(const QByteArray& studyUID, const QByteArray& folder, bool& awaits) = 0;

protected:
    Catalogue() = default;
};

}  // namespace Kxg
