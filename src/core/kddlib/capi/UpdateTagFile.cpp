#include "kddlib/capi/Border.h"
#include "kddlib/capi/kddtagfile.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagfile/qa/QAData.h"
#include "platform/base/LogFile.h"
#include "platform/filecache/ExFileCache.h"

#include <QByteArray>
#include <QList>
#include <QString>

#include <vector>

using namespace Kdd;

namespace
{

QList<QByteArray> listOf(int count, const char** texts)
{
    QList<QByteArray> list;
    for (int i = 0; i < count; ++i)
        list.append(texts[i]);
    return list;
}

bool fail(const char* what, const QString& message)
{
    LogFile::errorf("%s: %s", what, qUtf8Printable(message));
    return false;
}

/// What was computed from the images as they were must not be served any more.
void removeStaleEntries(const QList<QByteArray>& names)
{
    ExFileCache cache;
    // No cache, no stale entries: the correction itself is done.
    if (cache.init().bad())
        return;
    for (const QByteArray& name : names) {
        if (name.contains("Level1"))
            cache.removeBuffer(name);
    }
}

/// Bytes are in the encoding that their declaration names; a wide text is in none any more.
bool parse(const QByteArray& xml, QAData& job, QString& message)
{
    return job.parse(xml, message);
}

bool parse(const QString& xml, QAData& job, QString& message)
{
    return job.parseText(xml, message);
}

template <typename Xml>
bool applyJob(const Xml& jobXml, QAData& job)
{
    QString message;
    if (!parse(jobXml, job, message))
        return fail("Error reading UPQ job XML", message);
    const bool isApplied = TagFile::applyQA(job, message);
    // Only where the correction is done, or will be: before that the entries are not stale.
    if (isApplied || job.outcome.fault == ChangeFault::Kept)
        removeStaleEntries(job.cacheEntries);
    return isApplied || fail("Error updating tag file", message);
}

/// A wide text as UTF-8. Null stays null, and empty does not become null.
QByteArray narrow(const wchar_t* text)
{
    return text != nullptr ? QByteArray("").append(QString::fromWCharArray(text).toUtf8()) : QByteArray();
}

const char* pointerTo(const QByteArray& text)
{
    return text.isNull() ? nullptr : text.constData();
}

/// An array of wide texts as one of UTF-8 texts; null stays null.
class NarrowTexts
{
public:
    NarrowTexts(int count, const wchar_t* const* texts)
    {
        if (texts == nullptr)
            return;
        for (int i = 0; i < count; ++i)
            mTexts.push_back(narrow(texts[i]));
        for (const QByteArray& text : mTexts)
            mPointers.push_back(pointerTo(text));
        mPointers.push_back(nullptr);  // so that there is an array without texts, too
    }

    const char** array() { return mPointers.empty() ? nullptr : mPointers.data(); }

private:
    std::vector<QByteArray> mTexts;
    std::vector<const char*> mPointers;
};

/// What both functions do once the XML is a pointer no more.
template <typename Xml>
bool update(const char* function, const Xml& jobXml, const char* studyUID, int count, const char** images,
            const char** cacheEntries)
{
    if (!isGiven(function, "the study UID", studyUID) || !areGiven(function, "an image UID", count, images) ||
        (cacheEntries != nullptr && !areGiven(function, "a cache entry", count, cacheEntries)))
        return false;
    QAData job;
    job.studyUID = studyUID;
    job.images = listOf(count, images);
    if (cacheEntries != nullptr)
        job.cacheEntries = listOf(count, cacheEntries);
    return applyJob(jobXml, job);
}

}  // namespace

bool UpdateTagFile(const char* jobXml, const char* studyUID, int count, const char** images,
                   const char** cacheEntries)
{
    return guarded(__func__, false, [&](const char* function) {
        return isGiven(function, "the job", jobXml) &&
               update(function, QByteArray(jobXml), studyUID, count, images, cacheEntries);
    });
}

bool UpdateTagFileW(const wchar_t* jobXml, const wchar_t* studyUID, int count, const wchar_t** images,
                    const wchar_t** cacheEntries)
{
    return guarded(__func__, false, [&](const char* function) {
        // These own the bytes that the pointers below lead to, for as long as the job runs.
        const QByteArray study = narrow(studyUID);
        NarrowTexts narrowImages(count, images);
        NarrowTexts narrowEntries(count, cacheEntries);
        return isGiven(function, "the job", jobXml) &&
               update(function, QString::fromWCharArray(jobXml), pointerTo(study), count,
                      narrowImages.array(), narrowEntries.array());
    });
}
