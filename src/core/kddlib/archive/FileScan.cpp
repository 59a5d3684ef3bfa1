#include "kddlib/archive/FileScan.h"

#include "kddlib/Limits.h"
#include "kddlib/archive/FileWalk.h"
#include "kddlib/archive/PlainInput.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "platform/os/FileStatus.h"

#include <algorithm>

namespace Kdd
{

Result FileScan::run(const QList<QByteArray>& paths, const std::function<Result(DicomInput)>& take)
{
    QList<QByteArray> files;
    Result found = findChanged(paths, files);
    return found.good() ? readAll(files, take) : found;
}

/// Files of the usual form are read ahead. Any other is read here, in its turn: what is said of it in the log then has
/// its place, and of several files of one image the last counts.
Result FileScan::readAll(const QList<QByteArray>& files, const std::function<Result(DicomInput)>& take)
{
    PlainFiles ahead(files, mReaders, kDefaultValueBound);
    for (int i = 0; i < files.size(); ++i) {
        if (mObserver.isCancelled())
            return {};
        DicomInput input;
        if (!takePlain(files.at(i), ahead.next(), input))
            input = parseInput(files.at(i), mDamage);
        Result taken = handOn(std::move(input), take);
        if (taken.bad())
            return taken;
        mObserver.progress(i + 1, files.size());
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
