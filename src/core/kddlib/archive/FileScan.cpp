#include "kddlib/archive/FileScan.h"

#include "kddlib/Limits.h"
#include "kddlib/archive/FileWalk.h"
#include "kddlib/archive/ObjectInput.h"
#include "kddlib/archive/ReadInput.h"
#include "kddlib/net/http/ObjectAddress.h"
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
    QList<QByteArray> urls;
    QList<QByteArray> local;
    for (const QByteArray& file : files)
        (isObjectAddress(file) ? urls : local).append(file);
    QHash<QByteArray, Kxg::FileStamp> known;
    Result taken = urls.isEmpty() ? Result() : mCatalogue.stampsOf(urls, known);
    PlainFiles filesAhead(local, mReaders, kDefaultValueBound);
    PlainObjects objectsAhead(taken.good() ? urls : QList<QByteArray>(), known, kDefaultValueBound);
    for (int i = 0; i < files.size() && taken.good() && !mObserver.isCancelled(); ++i) {
        const QByteArray& file = files.at(i);
        if (isObjectAddress(file))
            taken = takeNext(file, objectsAhead, take);
        else
            taken = takeNext(file, filesAhead, take);
        if (taken.good())
            mObserver.progress(i + 1, files.size());
    }
    return taken;
}

Result FileScan::takeNext(const QByteArray& file, PlainFiles& ahead,
                          const std::function<Result(DicomInput)>& take)
{
    DicomInput input;
    if (!takePlain(file, ahead.next(), input))
        input = parseInput(file, mDamage);
    return handOn(std::move(input), take);
}

Result FileScan::takeNext(const QByteArray& url, PlainObjects& ahead,
                          const std::function<Result(DicomInput)>& take)
{
    ObjectRead read = ahead.next();
    if (read.isUnchanged) {
        ++mUnchanged;
        return {};
    }
    return handOn(takeObject(url, std::move(read)), take);
}

Result FileScan::findChanged(const QList<QByteArray>& paths, QList<QByteArray>& changed)
{
    QSet<QByteArray> urls;
    for (const QByteArray& path : paths) {
        // Whether an object is there is seen when it is asked for.
        if (isObjectAddress(path)) {
            if (!urls.contains(path))
                changed.append(path);
            urls.insert(path);
            continue;
        }
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
            LogFile::warnf("%s is damaged: left out %s", shownAddress(input.path).constData(),
                           qUtf8Printable(input.leftOut));
        break;
    case DicomInput::Kind::Volume:
        break;
    // Handed on as well: the database notes it, so that it is not opened again.
    case DicomInput::Kind::Other:
        ++mSkipped;
        if (mNamesSkipped)
            LogFile::printf("Skipped %s: %s", shownAddress(input.path).constData(),
                            qUtf8Printable(input.reason));
        break;
    case DicomInput::Kind::Unusable:
        LogFile::errorf("Could not take %s: %s", shownAddress(input.path).constData(),
                        qUtf8Printable(input.reason));
        mRefused.push_back({shownAddress(input.path), input.reason});
        return {};
    }
    return take(std::move(input));
}

}  // namespace Kdd
