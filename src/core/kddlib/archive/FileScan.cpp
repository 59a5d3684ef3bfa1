#include "kddlib/archive/FileScan.h"

#include "kddlib/archive/FileWalk.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "platform/os/FileStatus.h"

#include <algorithm>
#include <deque>
#include <future>
#include <thread>
#include <vector>

namespace Kdd
{

namespace
{

/// Files read ahead of the one being handed on, so that reading uses every core.
constexpr int kFilesPerTask = 16;

std::vector<DicomInput> readSome(const QList<QByteArray>& paths, Damage damage)
{
    std::vector<DicomInput> inputs;
    inputs.reserve(static_cast<std::size_t>(paths.size()));
    for (const QByteArray& path : paths)
        inputs.push_back(readDicomInput(path, damage));
    return inputs;
}

}  // namespace

Result FileScan::run(const QList<QByteArray>& paths, const std::function<Result(DicomInput)>& take)
{
    QList<QByteArray> files;
    Result found = findChanged(paths, files);
    return found.good() ? readAll(files, take) : found;
}

/// Reads the files on as many threads as there are cores and hands them on in their order.
Result FileScan::readAll(const QList<QByteArray>& files, const std::function<Result(DicomInput)>& take)
{
    const unsigned ahead = qMax(1U, std::thread::hardware_concurrency());
    // Whatever ends this early waits for the reading that is under way: the future of a task joins its thread.
    std::deque<std::future<std::vector<DicomInput>>> running;
    int next = 0;
    qint64 done = 0;
    while (next < files.size() || !running.empty()) {
        // Bounded, because what was read stands in memory until it is its turn.
        while (next < files.size() && running.size() <= ahead) {
            running.push_back(
                std::async(std::launch::async, readSome, files.mid(next, kFilesPerTask), mDamage));
            next += kFilesPerTask;
        }
        // Handed on in their order, whichever is read first: of several files of one image the last counts.
        for (DicomInput& input : running.front().get()) {
            if (mObserver.isCancelled())
                return {};
            Result taken = handOn(std::move(input), take);
            if (taken.bad())
                return taken;
            mObserver.progress(++done, files.size());
        }
        running.pop_front();
    }
    return {};
}

Result FileScan::findChanged(const QList<QByteArray>& paths, QList<QByteArray>& changed)
{
    for (const QByteArray& path : paths) {
        QStringList faults;
        const QList<QByteArray> files = filesBelow({path}, faults);
        for (const QString& fault : qAsConst(faults)) {
            LogFile::errorf("Could not look into %s", qUtf8Printable(fault));
            mRefused.push_back({path, fault});
        }
        QHash<QByteArray, Kxg::FileStamp> known;
        Result asked = mCatalogue.knownFiles(absolutePath(path), known);
        if (asked.bad())
            return asked;
        for (const QByteArray& file : files) {
            if (isOwn(file))
                continue;
            const auto stamp = known.constFind(file);
            FileStatus status;
            // A file whose status cannot be had counts as changed: reading it tells what is wrong.
            if (stamp != known.cend() && statusOf(file.constData(), status) && status.size == stamp->size &&
                status.modified == stamp->modified)
                ++mUnchanged;
            else
                changed.append(file);
        }
    }
    return {};
}

bool FileScan::isOwn(const QByteArray& file) const
{
    return std::any_of(mOwnPlaces.begin(), mOwnPlaces.end(), [&](const QByteArray& place) {
        return place.endsWith('/') ? file.startsWith(place) : file == place;
    });
}

Result FileScan::handOn(DicomInput input, const std::function<Result(DicomInput)>& take)
{
    switch (input.kind) {
    case DicomInput::Kind::Image:
        if (!input.leftOut.isEmpty())
            LogFile::warnf("%s is damaged: left out %s", input.path.constData(),
                           qUtf8Printable(input.leftOut));
        break;
    case DicomInput::Kind::Volume:
        break;
    // Handed on as well: the database notes it, so that it is not opened again.
    case DicomInput::Kind::Other:
        ++mSkipped;
        if (mNamesSkipped)
            LogFile::printf("Skipped %s: %s", input.path.constData(), qUtf8Printable(input.reason));
        break;
    case DicomInput::Kind::Unusable:
        LogFile::errorf("Could not take %s: %s", input.path.constData(), qUtf8Printable(input.reason));
        mRefused.push_back({input.path, input.reason});
        return {};
    }
    return take(std::move(input));
}

}  // namespace Kdd
