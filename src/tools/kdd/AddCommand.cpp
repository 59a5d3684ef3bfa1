#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "tools/kdd/Commands.h"
#include "tools/kdd/DicomInput.h"
#include "tools/kdd/Progress.h"
#include "tools/kdd/Report.h"

#include <QMap>

#include <dcmtk/dcmdata/dctagkey.h>

#include <cstdio>
#include <deque>
#include <future>
#include <map>
#include <thread>
#include <vector>

namespace Kdd
{

namespace
{

const DcmTagKey kFilePath(0x0006, 0x7100);

/// Files read ahead of the one being placed, so that reading uses every core.
constexpr int kFilesPerTask = 16;

/// Images held in memory before the studies that got none for the longest time are written.
constexpr int kMaxPendingImages = 50000;

/// Merges that find the file held by others are tried again this often, two seconds each.
constexpr int kMergeAttempts = 60;

struct StudyTotals
{
    int series = 0;
    int images = 0;
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

class Adder
{
public:
    explicit Adder(const GlobalOptions& options)
        : mOptions(options)
    {
    }

    void take(DicomInput input)
    {
        switch (input.kind) {
        case DicomInput::Kind::Image:
            place(input);
            break;
        case DicomInput::Kind::NotDicom:
            ++mSkipped;
            if (mOptions.verbose)
                LogFile::printf("Skipped %s: %s", input.path.constData(), qUtf8Printable(input.reason));
            break;
        case DicomInput::Kind::Unusable:
            fail();
            LogFile::errorf("Could not take %s: %s", input.path.constData(), qUtf8Printable(input.reason));
            break;
        }
    }

    void fail(int count = 1) { mFailed += count; }

    void writeAll()
    {
        while (!mPending.empty())
            write(mPending.begin());
    }

    Outcome report() const;

private:
    using Pending = std::map<QByteArray, PendingStudy>;

    void place(DicomInput& input);
    void write(Pending::iterator study);
    void writeLongestUntouched();

    const GlobalOptions& mOptions;
    Pending mPending;
    QMap<QByteArray, StudyTotals> mTotals;
    qint64 mClock = 0;
    int mPendingImages = 0;
    int mSkipped = 0;
    int mFailed = 0;
};

void Adder::place(DicomInput& input)
{
    PendingStudy& study = mPending[input.studyUID];
    const QByteArray& path = input.path;
    const int before = study.file.imagesByUID().size();
    // The last of several files of one instance is kept, as when they are added one after the other.
    TagMap* image = study.file.addTagMap(input.map.release(), path.constData(), true);
    if (image == nullptr) {
        fail();
        LogFile::errorf("Could not take %s: it belongs nowhere", path.constData());
        return;
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
    if (mPendingImages > kMaxPendingImages)
        writeLongestUntouched();
}

void Adder::writeLongestUntouched()
{
    auto oldest = mPending.begin();
    for (auto it = mPending.begin(); it != mPending.end(); ++it) {
        if (it->second.lastTouched < oldest->second.lastTouched)
            oldest = it;
    }
    write(oldest);
}

void Adder::write(Pending::iterator study)
{
    TagFile& file = study->second.file;
    file.optimizeAll();
    bool isMerged = file.mergeIntoCacheFile();
    for (int i = 1; i < kMergeAttempts && !isMerged && file.wasLockedOut(); ++i)
        isMerged = file.mergeIntoCacheFile();
    if (isMerged) {
        const TagFile::Statistics statistics = file.statistics();
        StudyTotals& totals = mTotals[study->first];
        totals.series = statistics.series;
        totals.images = statistics.images;
        totals.tagFileBytes = statistics.storedSize;
    } else {
        LogFile::errorf("%d images of study %s are not added", study->second.images,
                        study->first.constData());
        fail(study->second.images);
        mTotals.remove(study->first);
    }
    mPendingImages -= study->second.images;
    mPending.erase(study);
}

Outcome Adder::report() const
{
    StudyTotals all;
    QList<QStringList> rows{{QStringLiteral("STUDY"), QStringLiteral("SERIES "), QStringLiteral("IMAGES "),
                             QStringLiteral("DICOM "), QStringLiteral("HEADERS "),
                             QStringLiteral("TAG FILE ")}};
    for (auto it = mTotals.cbegin(); it != mTotals.cend(); ++it) {
        const StudyTotals& study = it.value();
        all.series += study.series;
        all.images += study.images;
        rows.append({displayText(it.key()), QString::number(study.series), QString::number(study.images),
                     humanBytes(study.fileBytes), humanBytes(study.headerBytes),
                     humanBytes(study.tagFileBytes)});
    }
    if (mOptions.json) {
        printJson({{QStringLiteral("studies"), mTotals.size()},
                   {QStringLiteral("series"), all.series},
                   {QStringLiteral("images"), all.images},
                   {QStringLiteral("volumes"), 0},
                   {QStringLiteral("skipped"), mSkipped},
                   {QStringLiteral("failed"), mFailed}});
    } else if (!mOptions.quiet) {
        if (rows.size() > 1)
            printTable(rows);
        std::printf("%d studies, %d series, %d images; %d files skipped, %d failed\n", mTotals.size(),
                    all.series, all.images, mSkipped, mFailed);
    }
    return mFailed == 0 ? Outcome::Done : Outcome::Failed;
}

std::vector<DicomInput> readSome(const QList<QByteArray>& paths)
{
    std::vector<DicomInput> inputs;
    inputs.reserve(static_cast<std::size_t>(paths.size()));
    for (const QByteArray& path : paths)
        inputs.push_back(readDicomInput(path));
    return inputs;
}

/// Reads the files on as many threads as there are cores and hands them on in their order.
template <typename Take>
void readAll(const QList<QByteArray>& files, Take take)
{
    const unsigned ahead = qMax(1U, std::thread::hardware_concurrency());
    std::deque<std::future<std::vector<DicomInput>>> running;
    int next = 0;
    while (next < files.size() || !running.empty()) {
        while (next < files.size() && running.size() <= ahead) {
            running.push_back(std::async(std::launch::async, readSome, files.mid(next, kFilesPerTask)));
            next += kFilesPerTask;
        }
        for (DicomInput& input : running.front().get())
            take(std::move(input));
        running.pop_front();
    }
}

}  // namespace

Outcome runAdd(const GlobalOptions& options, const QList<QByteArray>& paths)
{
    QStringList faults;
    const QList<QByteArray> files = filesBelow(paths, faults);
    Adder adder(options);
    for (const QString& fault : qAsConst(faults)) {
        LogFile::errorf("Could not look into %s", qUtf8Printable(fault));
        adder.fail();
    }
    {
        Progress progress("Reading", !options.quiet);
        qint64 done = 0;
        readAll(files, [&](DicomInput input) {
            adder.take(std::move(input));
            progress.show(++done, files.size());
        });
    }
    adder.writeAll();
    return adder.report();
}

}  // namespace Kdd
