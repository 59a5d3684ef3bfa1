#include "server/dicomweb/search/SearchResource.h"

#include "server/dicomweb/search/AnswerXml.h"
#include "server/dicomweb/search/SearchRun.h"
#include "server/http/AcceptHeader.h"
#include "server/http/Compression.h"
#include "server/http/MultipartWriter.h"

#include <dcmtk/dcmdata/dcdeftag.h>
#include <kddlib/LogFile.h>
#include <kddlib/TagFile.h>

#include <algorithm>

namespace Kdd::DicomWeb
{
namespace
{

const QVector<Http::MediaType> kOffers = {
    {"application/dicom+json", {}}, {"application/json", {}}, {"multipart/related", kXmlMediaType}};

void addWarnings(const SearchRequest& request, const SearchRun& run, const QByteArray& root,
                 Http::Response& response)
{
    const QByteArray begin = "299 " + root + ": ";
    if (run.remaining() > 0)
        response.addHeader("Warning", begin + "There are " + (run.isRemainingCut() ? "at least " : "") +
                                          QByteArray::number(run.remaining()) +
                                          " additional results that can be requested");
    if (run.unread() > 0)
        response.addHeader("Warning", begin + QByteArray::number(run.unread()) +
                                          (run.unread() == 1 ? " study" : " studies") + " could not be read");
    if (request.isFuzzy)
        response.addHeader("Warning",
                           begin + "The fuzzymatching parameter is not supported. Only literal matching has"
                                   " been performed.");
}

Http::Response answerOf(const FoundAnswers& answers, const Http::MediaType& type)
{
    if (type.parts.isEmpty())
        return Http::textResponse(200, type.name, answers.json());
    // Without parts there is no such body.
    if (answers.count() == 0)
        return Http::Response(204);
    Http::MultipartWriter parts(type.parts);
    QByteArray body;
    for (int i = 0; i < answers.count(); ++i)
        body += xmlPart(answers.object(i), parts);
    return Http::textResponse(200, parts.mediaType(), body + parts.finish());
}

Http::Response studyIsWritten()
{
    Http::Response response = Http::failure(503, QStringLiteral("A study is being written; ask again"));
    response.addHeader("Retry-After", "1");
    return response;
}

/// Of images of a study that are asked for by their UIDs: whether one is registered and its tag file does not show it.
bool lacksRegistered(const SearchRequest& search, StudyShelf& shelf)
{
    const auto named =
        std::find_if(search.conditions.begin(), search.conditions.end(), [](const SearchCondition& each) {
            return !each.isInItems() && each.key() == DCM_SOPInstanceUID;
        });
    if (named == search.conditions.end() || search.study.isEmpty() || shelf.arrivals() == nullptr)
        return false;
    std::shared_ptr<const ServedStudy> study;
    shelf.find(search.study, study);
    return std::any_of(named->list.begin(), named->list.end(), [&](const QString& value) {
        const QByteArray uid = value.trimmed().toUtf8();
        const auto isShown = [&](const TagFile& file) { return file.findImage(uid) != nullptr; };
        return (study == nullptr || !study->look(isShown)) &&
               shelf.arrivals()->isRegistered(search.study, uid);
    });
}

}  // namespace

bool SearchResource::owns(const ResourcePath& path) const
{
    SearchRequest request;
    return SearchRequest::takePath(path, request);
}

Http::Response SearchResource::answer(const Http::Request& request, const ResourcePath& path)
{
    SearchRequest search;
    SearchPlan plan;
    QString reason;
    const int offer = Http::AcceptHeader::of(request).choose(kOffers);
    if (offer < 0)
        return Http::failure(406, QStringLiteral("Searches are answered as application/dicom+json or "
                                                 "multipart/related; type=\"application/dicom+xml\""));
    if (!SearchRequest::takePath(path, search))
        return Http::failure(404, QStringLiteral("No resource has this path"));
    if (!SearchRequest::parse(request.query, search, reason) || !SearchPlan::make(search, plan, reason))
        return Http::failure(400, reason);

    // Studies that have just come are known at once, but not what they consist of, nor all by which they may be seen.
    const bool isBelowStudies = search.level == SearchLevel::Series || search.level == SearchLevel::Instances;
    if (mShelf.arrivals() != nullptr && path.study.isEmpty() &&
        (isBelowStudies || request.studies != nullptr))
        mShelf.arrivals()->bringInOwn({});
    else if (isBelowStudies && mShelf.arrivals() != nullptr &&
             mShelf.arrivals()->bringIn(path.study) == Arrived::Held)
        // What was told as stored would be missing.
        return studyIsWritten();

    const QByteArray root = request.base;
    Http::Response response;
    const Result result = mDatabase.ask(request.studies, [&](Kxg::StudySearch& database) {
        FoundAnswers answers(search, root);
        SearchRun run(search, plan, database, mShelf);
        const Result done = run.run(answers);
        if (!run.tooBroad().isEmpty()) {
            response = Http::failure(413, run.tooBroad());
            return done;
        }
        if (run.isHeldUp()) {
            response = studyIsWritten();
            return done;
        }
        if (run.unread() > 0 && !search.study.isEmpty()) {
            response = Http::failure(500, QStringLiteral("The study's tag file is missing or damaged"));
            return done;
        }
        // Whatever the reason is, that it is not there would be wrong.
        if (isBelowStudies && answers.count() == 0 && lacksRegistered(search, mShelf)) {
            LogFile::warnf("Study %s does not show an image that is registered", search.study.constData());
            response = studyIsWritten();
            return done;
        }
        std::shared_ptr<const ServedStudy> study;
        if (isBelowStudies && !search.study.isEmpty() && answers.count() == 0 &&
            mShelf.find(search.study, study) == Presence::Unbuilt) {
            response = verdictOn(Presence::Unbuilt).response();
            return done;
        }
        response = answerOf(answers, kOffers.at(offer));
        response.addHeader("Vary", "Accept");
        addWarnings(search, run, root, response);
        return done;
    });
    if (result.bad())
        return Http::failure(503, QStringLiteral("The image database cannot be asked now"));
    if (response.status == 200)
        Http::compress(request, response);
    return response;
}

}  // namespace Kdd::DicomWeb
