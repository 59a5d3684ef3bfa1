#include "kddlib/archive/FileScan.h"

#include "kddlib/archive/ArchiveDatabase.h"
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

bool FileScan::run(const QList<QByteArray>& paths, const std::function<bool(DicomInput)>& take)
{
    QList<QByteArray> files;
    return findChanged(paths, files) && readAll(files, take);
}

/// Reads the files on as many threads as there are cores and hands them on in their order.
bool FileScan::readAll(const QList<QByteArray>& files, const std::function<bool(DicomInput)>& take)
{
    const unsigned ahead = qMax(1U, std::thread::hardware_concurrency());
    std::deque<std::future<std::vector<DicomInput>>> running;
    int next = 0;
    qint64 done = 0;
    while (next < files.size() || !running.empty()) {
        while (next < files.size() && running.size() <= ahead) {
            running.push_back(
                std::async(std::launch::async, readSome, files.mid(next, kFilesPerTask), mDamage));
            next += kFilesPerTask;
        }
        for (DicomInput& input : running.front().get()) {
            if (mObserver.isCancelled())
                return true;
            if (!handOn(std::move(input), take))
                return false;
            mObserver.progress(++done, files.size());
        }
        running.pop_front();
    }
    return true;
}

bool FileScan::findChanged(const QList<QByteArray>& paths, QList<QByteArray>& changed)
{
    for (const QByteArray& path : paths) {
        QStringList faults;
        const QList<QByteArray> files = filesBelow({path}, faults);
        for (const QString& fault : qAsConst(faults)) {
            LogFile::errorf("Could not look into %s", qUtf8Printable(fault));
            mRefused.push_back({path, fault});
        }
        QHash<QByteArray, Kxg::FileStamp> known;
        if (!succeeded(mCatalogue.knownFiles(absolutePath(path), known)))
            return false;
        for (const QByteArray& file : files) {
            if (isOwn(file))
                continue;
            const auto stamp = known.constFind(file);
            FileStatus status;
            if (stamp != known.cend() && statusOf(file.constData(), status) && status.size == stamp->size &&
                status.modified == stamp->modified)
                ++mUnchanged;
            else
                changed.append(file);
        }
    }
    return true;
}

bool FileScan::isOwn(const QByteArray& file) const
{
    return std::any_of(mOwnPlaces.begin(), mOwnPlaces.end(), [&](const QByteArray& place) {
        return place.endsWith('/') ? file.startsWith(place) : file == place;
    });
}

bool FileScan::handOn(DicomInput input, const std::function<bool(DicomInput)>& take)
{
    switch (input.kind) {
    case DicomInput::Kind::Image:
        if (!input.leftOut.isEmpty())
            LogFile::warnf("%s is damaged: left out %s", input.path.constData(),
                           qUtf8Printable(input.leftOut));
        break;
    case DicomInput::Kind::Volume:
        break;
    case DicomInput::Kind::Other:
        ++mSkipped;
        if (mNamesSkipped)
            LogFile::printf("Skipped %s: %s", input.path.constData(), qUtf8Printable(input.reason));
        break;
    case DicomInput::Kind::Unusable:
        LogFile::errorf("Could not take %s: %s", input.path.constData(), qUtf8Printable(input.reason));
        mRefused.push_back({input.path, input.reason});
        return true;
    }
    return take(std::move(input));
}

}  // namespace Kdd
