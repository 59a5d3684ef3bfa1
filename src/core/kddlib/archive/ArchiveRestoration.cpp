#include "kddlib/archive/ArchiveRestoration.h"

#include "kddlib/archive/FileScan.h"
#include "kddlib/archive/FileWalk.h"
#include "kddlib/archive/Registration.h"
#include "kddlib/net/http/ObjectAddress.h"
#include "kddlib/tagfile/StudyRecord.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "platform/os/FileStatus.h"
#include "platform/os/PathName.h"

#include <algorithm>

namespace Kdd
{

namespace
{

/// An object behind a URL counts as there: whoever builds its study asks the server.
bool isAbsent(const QByteArray& path)
{
    return !isObjectAddress(path) && presenceOf(pathText(path)) == FilePresence::Absent;
}

}  // namespace

Result ArchiveRestoration::run(const QByteArray& objects, Totals& totals)
{
    totals = {};
    QSet<QByteArray> unknown;
    Result result = findObjects(absolutePath(objects), unknown);
    if (result.good())
        result = findNamed(unknown);
    // Of several files of one image the one that is registered last is shown, so they need an order.
    QList<QByteArray> files = unknown.values();
    std::sort(files.begin(), files.end());
    if (result.good())
        result = take(files, totals);
    return result.good() ? countAbsent(totals) : result;
}

Result ArchiveRestoration::findObjects(const QByteArray& folder, QSet<QByteArray>& unknown)
{
    // An archive that never took any has no such folder.
    if (isAbsent(folder))
        return {};
    QStringList faults;
    for (const QByteArray& file : filesBelow({folder}, faults)) {
        // What is just arriving, or was when its server died, is looked after by the next server.
        if (!file.startsWith(folder + "/.incoming/"))
            unknown.insert(file);
    }
    for (const QString& fault : qAsConst(faults))
        LogFile::errorf("Could not look into %s", qUtf8Printable(fault));
    return mCatalogue.dropKnown(unknown);
}

/// Of the files that tag files name which are not those that the database believes them to be.
Result ArchiveRestoration::findNamed(QSet<QByteArray>& unknown)
{
    for (const QString& path : tagFilesOfArchive()) {
        if (mObserver.isCancelled())
            return {};
        TagFile file;
        // One that cannot be read is built anew where the database knows its study.
        if (!file.readWhenFree(path, nullptr, false))
            continue;
        Kxg::StudyContents contents;
        Result result = mCatalogue.studyContents(file.studyInstanceUID(), contents);
        if (result.good() && !isTagFile(path, contents.tagFile))
            result = look(file, contents, unknown);
        if (result.bad())
            return result;
    }
    return {};
}

Result ArchiveRestoration::look(const TagFile& file, const Kxg::StudyContents& contents,
                                QSet<QByteArray>& unknown)
{
    QSet<QByteArray> found;
    for (const TagMap* image : file.imagesByUID())
        found.insert(filePathOf(*image));
    for (const Kxg::ListedImage& image : contents.images)
        found.remove(image.path);
    Result result = mCatalogue.dropKnown(found);
    for (auto it = found.begin(); it != found.end();)
        it = isAbsent(*it) ? found.erase(it) : std::next(it);
    // Nothing is built of it, so that it stays as it is.
    if (result.good() && contents.images.empty() && found.isEmpty())
        mForeign.append(file.studyInstanceUID());
    unknown.unite(found);
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
                                          [](const Kxg::ListedImage& image) { return isAbsent(image.path); });
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
