#include "kddlib/archive/ArchiveRestoration.h"

#include "kddlib/archive/FileScan.h"
#include "kddlib/archive/FileWalk.h"
#include "kddlib/archive/Registration.h"
#include "kddlib/tagfile/StudyRecord.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "platform/os/FileStatus.h"
#include "platform/os/PathName.h"

#include <QSet>

#include <algorithm>

namespace Kdd
{

namespace
{

constexpr char kTagFileSuffix[] = ".tc";

bool isThere(const QByteArray& path)
{
    FileStatus status;
    return statusOf(path.constData(), status);
}

}  // namespace

Result ArchiveRestoration::run(const QByteArray& objects, Totals& totals)
{
    totals = {};
    QList<QByteArray> unknown;
    Result result = findObjects(absolutePath(objects), unknown);
    if (result.good())
        result = findNamed(unknown);
    if (result.good())
        result = take(unknown, totals);
    return result.good() ? countAbsent(totals) : result;
}

/// An archive that never took any has no such folder.
Result ArchiveRestoration::findObjects(const QByteArray& folder, QList<QByteArray>& unknown)
{
    if (!isThere(folder))
        return {};
    QHash<QByteArray, Kxg::FileStamp> known;
    QSet<QByteArray> forgotten;
    Result result = mCatalogue.knownFiles(folder, known);
    if (result.good())
        result = mCatalogue.forgottenFiles(folder, forgotten);
    QStringList faults;
    for (const QByteArray& file : filesBelow({folder}, faults)) {
        // What is just arriving, or was when its server died, is looked after by the next server.
        const bool isArriving = file.startsWith(folder + "/.incoming/");
        if (!isArriving && !known.contains(file) && !forgotten.contains(file))
            unknown.append(file);
    }
    for (const QString& fault : qAsConst(faults))
        LogFile::errorf("Could not look into %s", qUtf8Printable(fault));
    return result;
}

/// Of the files that tag files name which are not those that the database believes them to be.
Result ArchiveRestoration::findNamed(QList<QByteArray>& unknown)
{
    QStringList faults;
    const QByteArray folder = TagFile::metaFolder();
    for (const QByteArray& path : isThere(folder) ? filesBelow({folder}, faults) : QList<QByteArray>()) {
        if (mObserver.isCancelled())
            return {};
        TagFile file;
        // One that cannot be read is built anew where the database knows its study.
        if (!path.endsWith(kTagFileSuffix) || !file.readWhenFree(pathText(path), nullptr, false))
            continue;
        Kxg::StudyContents contents;
        Result result = mCatalogue.studyContents(file.studyInstanceUID(), contents);
        if (result.good() && !isTagFile(pathText(path), contents.tagFile))
            result = look(file, contents, unknown);
        if (result.bad())
            return result;
    }
    return {};
}

Result ArchiveRestoration::look(const TagFile& file, const Kxg::StudyContents& contents,
                                QList<QByteArray>& unknown)
{
    QSet<QByteArray> listed;
    for (const Kxg::ListedImage& image : contents.images)
        listed.insert(image.path);
    bool isAny = !listed.isEmpty();
    for (const TagMap* image : file.imagesByUID()) {
        const QByteArray path = filePathOf(*image);
        bool isNew = false;
        const Result result = listed.contains(path) ? Result() : isUnknown(path, isNew);
        if (result.bad())
            return result;
        isAny = isAny || isNew;
        if (isNew && !unknown.contains(path))
            unknown.append(path);
    }
    // Nothing is built of it, so that it stays as it is.
    if (!isAny)
        mForeign.append(file.studyInstanceUID());
    return {};
}

Result ArchiveRestoration::isUnknown(const QByteArray& path, bool& isSo)
{
    QHash<QByteArray, Kxg::FileStamp> known;
    QSet<QByteArray> forgotten;
    Result result = mCatalogue.knownFiles(path, known);
    if (result.good())
        result = mCatalogue.forgottenFiles(path, forgotten);
    isSo = known.isEmpty() && forgotten.isEmpty() && isThere(path);
    return result;
}

Result ArchiveRestoration::take(const QList<QByteArray>& files, Totals& totals)
{
    FileScan scan(mCatalogue, mObserver);
    Registration registration(mCatalogue);
    QMap<QByteArray, int> counts;
    Result result = scan.run(files, [&](const DicomInput& input) {
        if (!input.studyUID.isEmpty())
            ++counts[input.studyUID];
        return registration.add(input);
    });
    if (result.good())
        result = registration.flush();
    for (auto it = counts.cbegin(); it != counts.cend() && result.good(); ++it)
        LogFile::printf("Study %s: %d files that the database did not know are taken in",
                        it.key().constData(), it.value());
    totals.taken = registration.images() + registration.volumes();
    totals.absent += static_cast<int>(scan.refused().size());
    return result;
}

/// After what was found is taken in.
Result ArchiveRestoration::countAbsent(Totals& totals)
{
    std::vector<Kxg::StudySummary> studies;
    Result result = mCatalogue.listStudies(studies);
    QSet<QByteArray> present;
    for (const Kxg::StudySummary& study : studies) {
        Kxg::StudyContents contents;
        present.insert(study.studyInstanceUID);
        if (result.good())
            result = mCatalogue.studyContents(study.studyInstanceUID, contents);
        const auto absent = std::count_if(contents.images.begin(), contents.images.end(),
                                          [](const Kxg::ListedImage& image) { return !isThere(image.path); });
        if (absent > 0)
            LogFile::warnf("Study %s: %d of %d files are not there; what its tag file has of them stays",
                           study.studyInstanceUID.constData(), static_cast<int>(absent),
                           static_cast<int>(contents.images.size()));
        totals.absent += static_cast<int>(absent);
    }
    for (const QByteArray& study : qAsConst(mForeign)) {
        if (present.contains(study))
            continue;
        LogFile::warnf("Study %s: there is its tag file and nothing else, which stays as it is",
                       study.constData());
        ++totals.foreign;
    }
    return result;
}

}  // namespace Kdd
