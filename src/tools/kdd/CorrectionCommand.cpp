#include "server/dicomweb/change/CorrectionReport.h"
#include "server/dicomweb/change/JobText.h"
#include "tools/kdd/Commands.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Store.h"

#include <QFile>

#include <kddlib/ArchiveDatabase.h>
#include <kddlib/FileStatus.h>
#include <kddlib/Limits.h>
#include <kddlib/LogFile.h>
#include <kddlib/QAData.h>
#include <kddlib/StudyChange.h>
#include <kddlib/TagFile.h>

#include <cstdio>
#include <memory>

namespace Kdd
{

namespace
{

struct CorrectionRequest
{
    QString job;  ///< file of the job, XML or JSON
    QByteArray study;
    QList<QByteArray> images;
    QString imageList;  ///< file that names further images, one on each line; empty for none
    bool isPreview = false;
};

// Room for a million UIDs.
constexpr qint64 kMaxImageList = 64 * 1024 * 1024;

bool readFile(const QString& name, qint64 limit, QByteArray& content)
{
    QFile file(name);
    if (!file.open(QIODevice::ReadOnly)) {
        LogFile::errorf("Could not open %s: %s", qUtf8Printable(name), qUtf8Printable(file.errorString()));
        return false;
    }
    // One byte more tells a file that is too long, also where it has no size.
    content = file.read(limit + 1);
    if (content.size() <= limit)
        return true;
    LogFile::errorf("%s is longer than %lld bytes", qUtf8Printable(name), static_cast<long long>(limit));
    return false;
}

bool readJob(const CorrectionRequest& request, QAData& job)
{
    QByteArray text;
    QString message;
    if (!readFile(request.job, kMaxJobXml, text))
        return false;
    // No XML begins so.
    const auto form = text.trimmed().startsWith('{') ? DicomWeb::JobForm::Json : DicomWeb::JobForm::Xml;
    // The message names the line, and here the file is added.
    if (DicomWeb::readJob(text, form, job, message))
        return true;
    LogFile::errorf("%s: %s", qUtf8Printable(request.job), qUtf8Printable(message));
    return false;
}

bool readImages(const CorrectionRequest& request, QAData& job)
{
    job.images += request.images;
    QByteArray list;
    if (!request.imageList.isEmpty() && !readFile(request.imageList, kMaxImageList, list))
        return false;
    for (const QByteArray& line : list.split('\n')) {
        const QByteArray uid = line.trimmed();
        // The last line ends in a line feed, behind which there is an empty one.
        if (!uid.isEmpty())
            job.images.append(uid);
    }
    return true;
}

/// Asked of the folder, because a study that the database does not know can be corrected as well.
bool hasTagFile(const QByteArray& studyUID)
{
    return presenceOf(TagFile::cacheFilePathForStudy(studyUID.constData())) != FilePresence::Absent;
}

/// Of a move the new study may not be there yet, and the old one no longer, so neither has a beginning that names it.
bool resolveStudies(const CorrectionRequest& request, QAData& job)
{
    job.studyUID = request.study;
    // No move: the study is there, and a beginning of its UID is enough.
    if (job.oldStudyUID.isEmpty())
        return resolveStudy(request.study, job.studyUID);
    // Either will do: a first move has to make the one, and one that broke off may have emptied the other.
    if (hasTagFile(job.oldStudyUID) || hasTagFile(job.studyUID))
        return true;
    LogFile::errorf("Neither study %s nor study %s has a tag file", job.oldStudyUID.constData(),
                    job.studyUID.constData());
    return false;
}

const char* failureOf(ChangeFault fault, bool isPreview)
{
    if (fault == ChangeFault::Kept)
        return "The correction is kept, but not shown yet";
    return isPreview ? "The correction cannot be made" : "The correction is not made";
}

/// What would change: each value once, with how many images have it.
void printChanges(const QJsonArray& changes, bool isComplete)
{
    const auto text = [](const QJsonObject& attribute, const char* name) {
        return withoutControls(attribute.value(QLatin1String(name)).toString());
    };
    for (const QJsonValue group : changes) {
        const int count = group[QLatin1String("count")].toInt();
        std::printf("%d image%s:\n", count, count == 1 ? "" : "s");
        const QJsonArray attributes = group[QLatin1String("attributes")].toArray();
        for (const QJsonValue value : attributes) {
            const QJsonObject attribute = value.toObject();
            std::printf("  %s %s: \"%s\" -> \"%s\"\n", qUtf8Printable(text(attribute, "tag")),
                        qUtf8Printable(text(attribute, "keyword")), qUtf8Printable(text(attribute, "old")),
                        qUtf8Printable(text(attribute, "new")));
        }
    }
    if (!isComplete)
        std::printf("and more\n");
}

void report(const GlobalOptions& options, const QAData& job, bool isPreview)
{
    const QAData::Outcome& outcome = job.outcome;
    // Told of the study in which they were looked for, which of a move is the old one.
    for (const QByteArray& uid : outcome.notFound)
        LogFile::errorf("There is no %s %s in study %s", job.series.contains(uid) ? "series" : "image",
                        uid.constData(),
                        (job.oldStudyUID.isEmpty() ? job.studyUID : job.oldStudyUID).constData());
    const int notFound = outcome.notFound.size();
    QJsonArray changes;
    const bool isComplete = !isPreview || DicomWeb::tellChanges(outcome, changes);
    if (options.json) {
        QJsonObject told = {{QStringLiteral("images"), outcome.asked},
                            {QStringLiteral("changed"), outcome.changed},
                            {QStringLiteral("moved"), outcome.moved},
                            {QStringLiteral("notFound"), notFound}};
        if (isPreview) {
            told.insert(QStringLiteral("preview"), true);
            told.insert(QStringLiteral("changes"), changes);
            told.insert(QStringLiteral("complete"), isComplete);
        }
        printJson(told);
    } else if (!options.quiet) {
        printChanges(changes, isComplete);
        std::printf("%d images: %d %schanged, %d moved, %d not found\n", outcome.asked, outcome.changed,
                    isPreview ? "would be " : "", outcome.moved, notFound);
    }
}

Outcome runCorrection(const GlobalOptions& options, const CorrectionRequest& request)
{
    QAData job;
    if (!readJob(request, job))
        return Outcome::Failed;
    const bool namesImages = !job.images.isEmpty() || !job.series.isEmpty() || job.isOfWholeStudy;
    if (!namesImages && request.images.isEmpty() && request.imageList.isEmpty()) {
        LogFile::errorf("Name the images: --image UID... or --images FILE");
        return Outcome::WrongUsage;
    }
    if (!readImages(request, job) || !resolveStudies(request, job))
        return Outcome::Failed;
    const Result result = request.isPreview ? StudyChange::preview(job) : StudyChange::correct(job);
    if (!succeeded(result.within(QString::fromLatin1(failureOf(job.outcome.fault, request.isPreview)))))
        return Outcome::Failed;
    report(options, job, request.isPreview);
    // The others are corrected, but not all that was asked for is done.
    return job.outcome.notFound.isEmpty() ? Outcome::Done : Outcome::Failed;
}

}  // namespace

void declareCorrection(CommandSet& commands)
{
    const CommandText text = {
        "qa", kChanging, "Correct attributes of images, or move images to another study",
        "The job is done for all its images or for none. It is kept in the database, so that every later "
        "build makes it again, and told in each image's audit log. The DICOM files stay as they are.",
        "kdd qa job.xml --study 2.25.2062 --images images.txt --preview\n"
        "kdd qa job.xml --study 2.25.2062 --images images.txt\n"
        "kdd qa job.xml --study 2.25.2062 --image 2.25.118095209191961083373906363074726608325"};
    const auto request = std::make_shared<CorrectionRequest>();
    ArgumentList arguments = commands.declare(
        text, [request](const GlobalOptions& options) { return runCorrection(options, *request); });
    arguments.path({"JOB", kFile, "File that says what to correct, XML or JSON", true}, request->job);
    arguments.text({"--study", kStudy,
                    "Study Instance UID, or a unique beginning of it; of a move all of the new study's",
                    true},
                   request->study);
    arguments.texts({"--image", kUid, "SOP Instance UIDs"}, request->images);
    arguments.path({"--images", kFile, "File of SOP Instance UIDs, one on each line"}, request->imageList);
    arguments.flag("--preview", request->isPreview, "Tell what would be changed, and change nothing");
}

}  // namespace Kdd
