#include "kddlib/archive/StudyIndexing.h"

#include "kddlib/archive/ArchiveDatabase.h"
#include "kddlib/archive/WorkObserver.h"
#include "kddlib/tagfile/SearchAttributes.h"
#include "kddlib/tagfile/StudyRecord.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "platform/os/FileStatus.h"
#include "platform/os/PathName.h"

#include <algorithm>

namespace Kdd
{

namespace
{

constexpr int kPage = 200;  // [studies]

QString tagFileOf(const QByteArray& studyUID)
{
    return TagFile::cacheFilePathForStudy(studyUID.constData());
}

bool statusOfTagFile(const QByteArray& studyUID, FileStatus& status)
{
    return statusOf(pathBytes(tagFileOf(studyUID)).constData(), status);
}

}  // namespace

bool StudyIndexing::isCurrent(const Kxg::FoundStudy& study)
{
    FileStatus status;
    return !statusOfTagFile(study.uid, status) || status.size == 0 ||
           (study.isBuilt && status.size == study.tagFile.fileSize &&
            status.modified == study.tagFile.modified);
}

bool StudyIndexing::isStudyAttribute(const DcmTagKey& key)
{
    return isKeptOfStudy(key);
}

bool StudyIndexing::isSeriesAttribute(const DcmTagKey& key)
{
    return isKeptOfSeries(key);
}

StudyIndexing::Standing StudyIndexing::standingOf(const TagMap& image, const Kxg::StudyLimits& limits)
{
    const Kxg::StudySearchRecord study = searchRecord({{image.uid(TagMap::ImageLevel), &image}});
    Standing standing = Standing::Within;
    for (const Kxg::StudyLimit& limit : limits.all) {
        const bool isOfSeries = limit.of == Kxg::StudyLimit::Of::Series;
        const QByteArray& lines = isOfSeries ? study.series.front().attributes : study.attributes;
        const bool isUid = limit.of == Kxg::StudyLimit::Of::Uid;
        const bool holds =
            isUid ? limit.values.contains(image.uid(TagMap::StudyLevel))
                  : std::any_of(limit.values.begin(), limit.values.end(),
                                [&](const QByteArray& line) { return lines.contains(line + '\n'); });
        if (!holds && (isUid || lines.contains(limit.attribute + '{')))
            return Standing::Beyond;
        if (!holds)
            standing = Standing::Silent;
    }
    return standing;
}

int StudyIndexing::refresh(const std::vector<const Kxg::FoundStudy*>& studies)
{
    int changed = 0;
    for (const Kxg::FoundStudy* study : studies) {
        bool isDone = false;
        const Result result = isCurrent(*study) ? Result() : take(*study, isDone);
        if (result.bad())
            LogFile::warnf("Searches know an earlier state of study %s: %s", study->uid.constData(),
                           qUtf8Printable(result.text()));
        changed += isDone ? 1 : 0;
    }
    return changed;
}

Result StudyIndexing::take(const Kxg::FoundStudy& study, bool& isDone)
{
    TagFile file;
    FileStatus before;
    FileStatus after;
    if (!statusOfTagFile(study.uid, before))
        return {};
    if (!file.readStampedWhenFree(tagFileOf(study.uid), study.uid.constData()))
        return Result::failure(file.failure());
    Kxg::BuiltStudy present = builtStudy(file);
    // What was written while it was being read is noticed by the next look.
    if (!statusOfTagFile(study.uid, after) || after.size != before.size || after.modified != before.modified)
        before = {};
    present.tagFile.fileSize = before.size;
    present.tagFile.modified = before.modified;
    return mSearch.refresh(study, present, isDone);
}

bool StudyIndexing::fill(WorkObserver& observer, Totals& totals)
{
    totals = {};
    if (!succeeded(mSearch.prepare()))
        return false;
    QVector<QByteArray> page;
    QByteArray last;
    while (!observer.isCancelled()) {
        if (!succeeded(mSearch.unknownStudies(last, kPage, page)))
            return false;
        if (page.isEmpty())
            return true;
        last = page.last();
        Kxg::SearchQuery query;
        query.limit = kPage;
        query.terms.push_back({Kxg::SearchColumn::StudyUID, page, {}, {}, {}, {}, {}});
        std::vector<Kxg::FoundStudy> found;
        if (!succeeded(mSearch.studies(query, found)))
            return false;
        for (const Kxg::FoundStudy& study : found) {
            if (observer.isCancelled())
                break;
            bool isDone = false;
            ++(succeeded(take(study, isDone)) ? totals.studies : totals.failed);
            observer.progress(totals.studies + totals.failed, 0);
        }
    }
    return true;
}

}  // namespace Kdd
