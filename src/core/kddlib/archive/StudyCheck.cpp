#include "kddlib/archive/StudyCheck.h"

#include "kddlib/Limits.h"
#include "kddlib/archive/ArchiveDatabase.h"
#include "kddlib/archive/DatasetVerifier.h"
#include "kddlib/archive/FileWalk.h"
#include "kddlib/archive/TagFileProof.h"
#include "kddlib/archive/WorkObserver.h"
#include "kddlib/net/dicom/RemoteDicom.h"
#include "kddlib/net/http/ObjectAddress.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagfile/qa/BuildCorrections.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/Volume.h"
#include "platform/os/FileStatus.h"
#include "platform/os/PathName.h"

#include <QSet>

#include <dcmtk/dcmdata/dcfilefo.h>

#include <memory>
#include <utility>

namespace Kdd
{

namespace
{

/// For whoever works on a study that has to be looked at again [ms].
constexpr int kPatience = 10 * 60 * 1000;

QString textOf(const QByteArray& bytes)
{
    return pathText(shownAddress(bytes));
}

/// Why a study's tag file cannot be read, more plainly than the reader can tell.
QString reasonOf(const QString& path, const TagFile& tried)
{
    const FilePresence presence = presenceOf(path);
    if (presence == FilePresence::Absent)
        return QStringLiteral("has no tag file");
    if (presence == FilePresence::Empty)
        return QStringLiteral("has an empty tag file, %1").arg(path);
    // Without asking for the study: the file may be a sound one of another study.
    TagFile any;
    if (any.readCacheFile(path, nullptr, false))
        return QStringLiteral("has a tag file, %1, that holds study %2")
            .arg(path, textOf(any.studyInstanceUID()));
    return QStringLiteral("has a tag file, %1, that cannot be read: %2").arg(path, tried.failure());
}

QByteArray baseName(const QByteArray& path)
{
    return path.mid(path.lastIndexOf('/') + 1);
}

/// By what volumes are known in a tag file: the end of their file's name, or all of it after a sync.
bool isVolumeOf(const Volume& volume, const QByteArray& path)
{
    const QByteArray base = baseName(path);
    return volume.volumeFileName() == base ||
           volume.fileNameSuffix() == Volume::fileNameSuffix(base.constData());
}

}  // namespace

StudyCheck::StudyCheck(Kxg::Catalogue& catalogue, WorkObserver& observer,
                       std::function<void(const QString&)> report)
    : mCatalogue(catalogue)
    , mObserver(observer)
    , mReport(std::move(report))
    , mCorrections(std::make_unique<BuildCorrections>())
{
}

StudyCheck::~StudyCheck() = default;

void StudyCheck::fault(const QString& text)
{
    ++mFindings.differences;
    mReport(text);
}

void StudyCheck::checkAll()
{
    std::vector<Kxg::StudySummary> studies;
    if (!succeeded(mCatalogue.listStudies(studies))) {
        ++mFindings.unreadable;
        return;
    }
    QSet<QString> known;
    for (const Kxg::StudySummary& study : studies) {
        if (mObserver.isCancelled())
            return;
        // Where only volume files are left there is no tag file.
        if (study.images == 0)
            continue;
        check(study.studyInstanceUID);
        known.insert(TagFile::cacheFilePathForStudy(study.studyInstanceUID.constData()));
    }
    // Tag files that no study of the database accounts for.
    for (const QString& path : tagFilesOfArchive()) {
        if (!known.contains(path) && !mObserver.isCancelled())
            checkUnknown(path);
    }
}

void StudyCheck::check(const QByteArray& studyUID)
{
    TagFile file;
    if (!succeeded(mCatalogue.studyContents(studyUID, mContents))) {
        ++mFindings.unreadable;
        return;
    }
    if (mContents.isCorrected && !succeeded(mCorrections->read(mContents.id))) {
        ++mFindings.unreadable;
        return;
    }
    if (mContents.isWaiting)
        fault(QStringLiteral("Study %1 waits to be built").arg(textOf(studyUID)));
    if (!read(studyUID, file))
        return;
    ++mFindings.studies;
    if (!mContents.isWaiting)
        checkListing(studyUID, file);
    checkPreviews(studyUID, file);
    checkImages(file);
}

void StudyCheck::checkImages(const TagFile& file)
{
    const auto& images = file.imagesByUID();
    QList<QByteArray> urls;
    for (const TagMap* image : images) {
        const QByteArray path = filePathOf(*image);
        if (isObjectAddress(path))
            urls.append(path);
    }
    RemoteHeaders ahead(urls, kRemoteHead);
    qint64 done = 0;
    for (auto it = images.cbegin(); it != images.cend() && !mObserver.isCancelled(); ++it) {
        const QByteArray path = filePathOf(*it.value());
        if (isObjectAddress(path))
            checkLoaded(it.key(), *it.value(), ahead.next());
        else
            checkImage(it.key(), *it.value());
        mObserver.progress(++done, images.size());
    }
}

bool StudyCheck::read(const QByteArray& studyUID, TagFile& file)
{
    if (file.readWhenFreeForStudy(studyUID.constData(), false))
        return true;
    // One that waits to be built for the first time has none yet, which was told.
    const QString path = TagFile::cacheFilePathForStudy(studyUID.constData());
    if (!mContents.isWaiting || presenceOf(path) != FilePresence::Absent) {
        ++mFindings.unreadable;
        mReport(QStringLiteral("Study %1 %2").arg(textOf(studyUID), reasonOf(path, file)));
    }
    return false;
}

/// Of a study that does not wait. While one waits, its tag file may differ from
/// the database, and the build will mend that.
void StudyCheck::checkListing(const QByteArray& studyUID, const TagFile& file)
{
    const QString study = textOf(studyUID);
    TagFileProof proof(mCatalogue, studyUID);
    if (!succeeded(proof.run(kPatience)))
        ++mFindings.unreadable;
    else if (proof.isFault())
        fault(proof.fault() + QStringLiteral("; \"kdd build --all\" builds it anew"));
    QSet<QByteArray> listed;
    for (const Kxg::ListedImage& each : mContents.images) {
        const QByteArray& key = each.key();
        listed.insert(key);
        const TagMap* image = file.findImage(key);
        if (image == nullptr)
            fault(QStringLiteral("Image %1 of study %2, %3, is not in the tag file")
                      .arg(textOf(key), study, textOf(each.path)));
        else if (filePathOf(*image) != each.path)
            fault(QStringLiteral("Image %1 of study %2 is taken from %3, but %4 is registered")
                      .arg(textOf(key), study, textOf(filePathOf(*image)), textOf(each.path)));
        else if (image->uid(TagMap::SeriesLevel) != each.seriesInstanceUID)
            fault(QStringLiteral("Image %1 of study %2 stands in series %3, but is registered in series %4")
                      .arg(textOf(key), study, textOf(image->uid(TagMap::SeriesLevel)),
                           textOf(each.seriesInstanceUID)));
    }
    for (auto it = file.imagesByUID().keyBegin(); it != file.imagesByUID().keyEnd(); ++it) {
        if (!listed.contains(*it))
            fault(QStringLiteral("Image %1 of study %2 is not registered").arg(textOf(*it), study));
    }
    checkVolumes(studyUID, file);
}

/// Of a study with corrections no file says how its volumes were divided.
void StudyCheck::checkVolumes(const QByteArray& studyUID, const TagFile& file)
{
    if (mContents.isCorrected)
        return;
    QSet<QByteArray> found;
    for (const TagMap* series : file.seriesByUID()) {
        for (const Volume* volume : series->volumes()) {
            const QByteArray name =
                volume->volumeFileName().isEmpty() ? volume->fileNameSuffix() : volume->volumeFileName();
            const auto& paths = mContents.volumes;
            // Each file answers for one volume: two of the same suffix need two files.
            const auto path = std::find_if(paths.begin(), paths.end(), [&](const QByteArray& each) {
                return !found.contains(each) && isVolumeOf(*volume, each);
            });
            if (path != paths.end())
                found.insert(*path);
            else
                fault(QStringLiteral("Volume \"%1\" of study %2 is not registered")
                          .arg(textOf(name), textOf(studyUID)));
        }
    }
    for (const QByteArray& path : qAsConst(mContents.volumes)) {
        if (!found.contains(path))
            fault(QStringLiteral("Volume file %1 of study %2 is not in the tag file")
                      .arg(textOf(path), textOf(studyUID)));
    }
}

void StudyCheck::checkPreviews(const QByteArray& studyUID, const TagFile& file)
{
    if (const int missing = file.statistics().missingBlobs)
        fault(QStringLiteral("The tag file of study %1 ends early: %2 previews are missing")
                  .arg(textOf(studyUID))
                  .arg(missing));
}

void StudyCheck::checkImage(const QByteArray& key, const TagMap& image)
{
    LoadedHeader loaded{std::make_unique<DcmFileFormat>(), {}};
    loaded.condition = loadDicomHeader(filePathOf(image), *loaded.format);
    checkLoaded(key, image, loaded);
}

void StudyCheck::checkLoaded(const QByteArray& key, const TagMap& image, const LoadedHeader& loaded)
{
    const QByteArray path = filePathOf(image);
    if (loaded.condition.bad()) {
        ++mFindings.unreadable;
        mReport(QStringLiteral("Could not load %1: %2")
                    .arg(textOf(path), QString::fromLatin1(loaded.condition.text())));
        return;
    }
    DcmFileFormat& dicom = *loaded.format;
    ++mFindings.images;
    const auto report = [&](const QByteArray& attribute, const QByteArray& what) {
        mReport(QStringLiteral("Image %1: %2 %3").arg(textOf(key), textOf(attribute), textOf(what)));
    };
    // A corrected image differs from its file on purpose: it is held
    // against the file with the corrections on top.
    std::unique_ptr<TagMap> expected;
    if (mContents.isCorrected)
        expected.reset(TagMap::createTagMap(dicom.getDataset(), kDefaultValueBound));
    if (expected == nullptr || mCorrections->find(identityOf(*expected, path)) == nullptr)
        mFindings.differences += verifyDataset(*dicom.getDataset(), image, report);
    else if (mCorrections->applyTo(*expected, path))
        mFindings.differences += verifyCorrected(*expected, image, report);
    else
        ++mFindings.unreadable;
}

/// A tag file that the catalogue does not know of, or one that lies under another study's name.
void StudyCheck::checkUnknown(const QString& path)
{
    TagFile file;
    if (!file.readCacheFile(path, nullptr, false)) {
        ++mFindings.unreadable;
        mReport(presenceOf(path) == FilePresence::Empty
                    ? QStringLiteral("The tag file %1 is empty").arg(path)
                    : QStringLiteral("The tag file %1 cannot be read: %2").arg(path, file.failure()));
        return;
    }
    const QString study = textOf(file.studyInstanceUID());
    if (file.cacheFilePath() != path)
        fault(QStringLiteral("The tag file %1 holds study %2, whose place is another one").arg(path, study));
    else
        fault(QStringLiteral("Study %1 has a tag file, %2, but is not registered").arg(study, path));
}

}  // namespace Kdd
