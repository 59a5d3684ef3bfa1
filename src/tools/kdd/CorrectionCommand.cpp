#include "kddlib/Limits.h"
#include "kddlib/archive/StudyChange.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagfile/qa/QAData.h"
#include "platform/base/LogFile.h"
#include "tools/kdd/Commands.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Store.h"

#include <QFile>

#include <cstdio>

namespace Kdd
{

namespace
{

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
    QByteArray xml;
    QString message;
    if (!readFile(request.job, kMaxJobXml, xml))
        return false;
    if (job.parse(xml, message))
        return true;
    LogFile::errorf("%s: %s", qUtf8Printable(request.job), qUtf8Printable(message));
    return false;
}

bool readImages(const CorrectionRequest& request, QAData& job)
{
    job.images = request.images;
    QByteArray list;
    if (!request.imageList.isEmpty() && !readFile(request.imageList, kMaxImageList, list))
        return false;
    for (const QByteArray& line : list.split('\n')) {
        const QByteArray uid = line.trimmed();
        if (!uid.isEmpty())
            job.images.append(uid);
    }
    return true;
}

bool hasTagFile(const QByteArray& studyUID)
{
    return QFile::exists(TagFile::cacheFilePathForStudy(studyUID.constData()));
}

/// Of a move the new study may not be there yet, and the old one no longer, so neither has a beginning that names it.
bool resolveStudies(const CorrectionRequest& request, QAData& job)
{
    job.studyUID = request.study;
    if (job.oldStudyUID.isEmpty())
        return resolveStudy(request.study, job.studyUID);
    if (hasTagFile(job.oldStudyUID) || hasTagFile(job.studyUID))
        return true;
    LogFile::errorf("Neither study %s nor study %s has a tag file", job.oldStudyUID.constData(),
                    job.studyUID.constData());
    return false;
}

bool apply(QAData& job)
{
    QString message;
    const bool isDone = StudyChange::correct(job, message);
    if (!isDone)
        LogFile::errorf("The correction is not made: %s", qUtf8Printable(message));
    return isDone;
}

void report(const GlobalOptions& options, const QAData& job)
{
    const QAData::Outcome& outcome = job.outcome;
    for (const QByteArray& uid : outcome.notFound)
        LogFile::errorf("There is no image %s in study %s", uid.constData(),
                        (job.oldStudyUID.isEmpty() ? job.studyUID : job.oldStudyUID).constData());
    const int notFound = outcome.notFound.size();
    if (options.json) {
        printJson({{QStringLiteral("images"), job.images.size()},
                   {QStringLiteral("changed"), outcome.changed},
                   {QStringLiteral("moved"), outcome.moved},
                   {QStringLiteral("notFound"), notFound}});
    } else if (!options.quiet) {
        std::printf("%d images: %d changed, %d moved, %d not found\n", job.images.size(), outcome.changed,
                    outcome.moved, notFound);
    }
}

}  // namespace

Outcome runCorrection(const GlobalOptions& options, const CorrectionRequest& request)
{
    if (request.images.isEmpty() && request.imageList.isEmpty()) {
        LogFile::errorf("Name the images: --image UID... or --images FILE");
        return Outcome::WrongUsage;
    }
    QAData job;
    if (!readJob(request, job) || !readImages(request, job) || !resolveStudies(request, job))
        return Outcome::Failed;
    if (!apply(job))
        return Outcome::Failed;
    report(options, job);
    return job.outcome.notFound.isEmpty() ? Outcome::Done : Outcome::Failed;
}

}  // namespace Kdd
