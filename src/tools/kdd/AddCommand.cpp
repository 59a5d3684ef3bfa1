#include "kddlib/TagFileGenerator.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "tools/kdd/Commands.h"
#include "tools/kdd/Database.h"
#include "tools/kdd/FileScan.h"
#include "tools/kdd/Registration.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/StudyBuild.h"

#include <QMap>

#include <dcmtk/dcmdata/dctagkey.h>

#include <cstdio>
#include <map>

namespace Kdd
{

namespace
{

/// Images held in memory before the studies that got none for the longest time are written.
constexpr int kMaxPendingImages = 50000;

/// Merges that find the file held by others are tried again this often, two seconds each.
constexpr int kMergeAttempts = 60;

struct StudyTotals
{
    int series = 0;
    int images = 0;
    int volumes = 0;
    qint64 fileBytes = 0;
    qint64 headerBytes = 0;
    qint64 tagFileBytes = 0;
};

/// A study whose images are being collected.
struct PendingStudy
{
    TagFile file;
    int images = 0;
    qint64 lastTouched = 0;
};

/// Takes files into the database and into the tag files of their studies.
class Adder
{
public:
    explicit Adder(Kxg::Catalogue& database)
        : mDatabase(database)
        , mRegistration(database)
    {
    }

    /// False when the database failed.
    bool take(DicomInput input)
    {
        if (!mRegistration.add(input))
            return false;
        if (input.kind == DicomInput::Kind::Image)
            return place(input);
        if (input.kind == DicomInput::Kind::Volume)
            mPending[input.studyUID].lastTouched = ++mClock;
        return true;
    }

    bool writeAll()
    {
        while (!mPending.empty()) {
            if (!write(mPending.begin()))
                return false;
        }
        return mRegistration.flush();
    }

    /// Builds what an earlier run registered below the paths without coming to the end of it.
    bool completeWaiting(const QList<QByteArray>& paths);

    Outcome report(const GlobalOptions& options, const FileScan& scan) const;

private:
    using Pending = std::map<QByteArray, PendingStudy>;

    bool place(DicomInput& input);
    bool write(Pending::iterator study);
    bool writeClaimed(Kxg::StudyClaim& claim, TagFile& arrivals);
    static bool merge(TagFile& file);
    bool writeLongestUntouched();
    void count(const QByteArray& studyUID, const TagFile& file);
    StudyTotals sum() const;

    Kxg::Catalogue& mDatabase;
    Registration mRegistration;
    Pending mPending;
    QMap<QByteArray, StudyTotals> mTotals;
    qint64 mClock = 0;
    int mPendingImages = 0;
    int mFailed = 0;
};

bool Adder::place(DicomInput& input)
{
    PendingStudy& study = mPending[input.studyUID];
    const QByteArray& path = input.path;
    const int before = study.file.imagesByUID().size();
    // The last of several files of one instance is kept, as when they are added one after the other.
    TagMap* image = study.file.addTagMap(input.map.release(), path.constData(), true);
    if (image == nullptr) {
        ++mFailed;
        LogFile::errorf("Could not take %s: it belongs nowhere", path.constData());
        return true;
    }
    image->putAndInsertValue(kFilePath, VrCode::LO, path);
    if (study.file.imagesByUID().size() == before) {
        LogFile::warnf("%s replaces another file of the same SOP Instance UID", path.constData());
    } else {
        ++study.images;
        ++mPendingImages;
    }
    study.lastTouched = ++mClock;
    StudyTotals& totals = mTotals[input.studyUID];
    totals.fileBytes += input.fileBytes;
    totals.headerBytes += input.headerBytes;
    return mPendingImages <= kMaxPendingImages || writeLongestUntouched();
}

bool Adder::writeLongestUntouched()
{
    auto oldest = mPending.begin();
    for (auto it = mPending.begin(); it != mPending.end(); ++it) {
        if (it->second.lastTouched < oldest->second.lastTouched)
            oldest = it;
    }
    return write(oldest);
}

/// False when the database failed; a study that cannot be written is told and counted.
bool Adder::write(Pending::iterator study)
{
    if (!mRegistration.flush())
        return false;
    const QByteArray studyUID = study->first;
    TagFile& file = study->second.file;
    const int images = study->second.images;
    const std::unique_ptr<Kxg::StudyClaim> claim = claimStudy(mDatabase, studyUID);
    if (claim == nullptr || !writeClaimed(*claim, file)) {
        LogFile::errorf("%d images of study %s are not added", images, studyUID.constData());
        mFailed += qMax(1, images);
        mTotals.remove(studyUID);
    }
    mPendingImages -= images;
    mPending.erase(study);
    return true;
}

/// Volumes are made of images that may be anywhere in the study, so a study with volume files is built as a whole; to
/// any other what arrived is added.
bool Adder::writeClaimed(Kxg::StudyClaim& claim, TagFile& arrivals)
{
    const QByteArray& studyUID = claim.studyInstanceUID();
    QVector<QByteArray> volumes;
    if (!succeeded(mDatabase.volumeFiles(studyUID, volumes)))
        return false;
    if (!volumes.isEmpty()) {
        TagFile whole;
        const bool isBuilt = buildStudy(claim, true, whole, arrivals);
        count(studyUID, whole);
        return isBuilt;
    }
    TagFileGenerator().completeArrivals(arrivals);
    const bool isMerged =
        merge(arrivals) && succeeded(mDatabase.finishRequests(mRegistration.requests().take(studyUID)));
    count(studyUID, arrivals);
    return isMerged;
}

bool Adder::merge(TagFile& file)
{
    bool isMerged = file.mergeIntoCacheFile();
    for (int i = 1; i < kMergeAttempts && !isMerged && file.wasLockedOut(); ++i)
        isMerged = file.mergeIntoCacheFile();
    return isMerged;
}

void Adder::count(const QByteArray& studyUID, const TagFile& file)
{
    const TagFile::Statistics statistics = file.statistics();
    StudyTotals& totals = mTotals[studyUID];
    totals.series = statistics.series;
    totals.images = statistics.images;
    totals.volumes = statistics.volumes;
    totals.tagFileBytes = statistics.storedSize;
}

bool Adder::completeWaiting(const QList<QByteArray>& paths)
{
    QSet<QByteArray> waiting;
    for (const QByteArray& path : paths) {
        QVector<QByteArray> studies;
        if (!succeeded(mDatabase.waitingStudies(absolutePath(path), studies)))
            return false;
        for (const QByteArray& study : qAsConst(studies))
            waiting.insert(study);
    }
    for (const QByteArray& studyUID : qAsConst(waiting)) {
        TagFile file;
        const std::unique_ptr<Kxg::StudyClaim> claim = claimStudy(mDatabase, studyUID);
        if (claim != nullptr && buildStudy(*claim, true, file))
            count(studyUID, file);
        else
            ++mFailed;
    }
    return true;
}

StudyTotals Adder::sum() const
{
    StudyTotals all;
    for (const StudyTotals& study : mTotals) {
        all.series += study.series;
        all.images += study.images;
        all.volumes += study.volumes;
    }
    return all;
}

Outcome Adder::report(const GlobalOptions& options, const FileScan& scan) const
{
    const StudyTotals all = sum();
    const int failed = mFailed + scan.failed();
    if (options.json) {
        printJson({{QStringLiteral("studies"), mTotals.size()},
                   {QStringLiteral("series"), all.series},
                   {QStringLiteral("images"), all.images},
                   {QStringLiteral("volumes"), all.volumes},
                   {QStringLiteral("unchanged"), scan.unchanged()},
                   {QStringLiteral("skipped"), scan.skipped()},
                   {QStringLiteral("failed"), failed}});
        return failed == 0 ? Outcome::Done : Outcome::Failed;
    }
    QList<QStringList> rows{{QStringLiteral("STUDY"), QStringLiteral("SERIES "), QStringLiteral("IMAGES "),
                             QStringLiteral("VOLUMES "), QStringLiteral("DICOM "), QStringLiteral("HEADERS "),
                             QStringLiteral("TAG FILE ")}};
    for (auto it = mTotals.cbegin(); it != mTotals.cend(); ++it) {
        const StudyTotals& study = it.value();
        rows.append({displayText(it.key()), QString::number(study.series), QString::number(study.images),
                     QString::number(study.volumes), humanBytes(study.fileBytes),
                     humanBytes(study.headerBytes), humanBytes(study.tagFileBytes)});
    }
    if (!options.quiet) {
        if (rows.size() > 1)
            printTable(rows);
        std::printf(
            "%d studies, %d series, %d images, %d volumes; %d files unchanged, %d skipped, %d failed\n",
            mTotals.size(), all.series, all.images, all.volumes, scan.unchanged(), scan.skipped(), failed);
    }
    return failed == 0 ? Outcome::Done : Outcome::Failed;
}

}  // namespace

Outcome runAdd(const GlobalOptions& options, const ScanRequest& request)
{
    const std::unique_ptr<Kxg::Catalogue> database = openDatabase();
    if (database == nullptr)
        return Outcome::Failed;
    FileScan scan(*database, options, request.tolerant ? Damage::Tolerated : Damage::Refused);
    Adder adder(*database);
    const bool isDone =
        scan.run(request.paths, [&](DicomInput input) { return adder.take(std::move(input)); }) &&
        adder.writeAll() && (scan.unchanged() == 0 || adder.completeWaiting(request.paths));
    const Outcome outcome = adder.report(options, scan);
    return isDone ? outcome : Outcome::Failed;
}

}  // namespace Kdd
