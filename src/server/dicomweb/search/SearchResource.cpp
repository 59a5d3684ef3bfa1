#include "server/dicomweb/search/SearchResource.h"

#include "server/dicomweb/search/SearchRun.h"
#include "server/http/AcceptHeader.h"

namespace Kdd::DicomWeb
{
namespace
{

const QVector<Http::MediaType> kOffers = {{"application/dicom+json", ""}, {"application/json", ""}};

void addWarnings(const SearchRequest& request, const SearchRun& run, const QByteArray& root,
                 Http::Response& response)
{
    const QByteArray begin = "299 " + root + ": ";
    if (run.remaining() > 0)
        response.addHeader("Warning", begin + "There are " + (run.isRemainingCut() ? "at least " : "") +
                                          QByteArray::number(run.remaining()) +
                                          " additional results that can be requested");
    if (request.isFuzzy)
        response.addHeader("Warning",
                           begin + "The fuzzymatching parameter is not supported. Only literal matching has"
                                   " been performed.");
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
        return Http::failure(406, QStringLiteral("Searches are answered as application/dicom+json"));
    if (!SearchRequest::takePath(path, search))
        return Http::failure(404, QStringLiteral("No resource has this path"));
    if (!SearchRequest::parse(request.query, search, reason) || !SearchPlan::make(search, plan, reason))
        return Http::failure(400, reason);

    // Studies that have just come are known at once, but not what they consist of.
    const bool isBelowStudies = search.level == SearchLevel::Series || search.level == SearchLevel::Instances;
    if (isBelowStudies && mShelf.arrivals() != nullptr)
        mShelf.arrivals()->bringInOwn(path.study);

    const QByteArray root = request.base;
    Http::Response response;
    const Result result = mDatabase.ask([&](Kxg::StudySearch& database) {
        FoundAnswers answers(search, root);
        SearchRun run(search, plan, database, mShelf);
        const Result done = run.run(answers);
        if (!run.tooBroad().isEmpty()) {
            response = Http::failure(413, run.tooBroad());
            return done;
        }
        if (run.isHeldUp()) {
            response = Http::failure(503, QStringLiteral("A study is being written; ask again"));
            response.addHeader("Retry-After", "1");
            return done;
        }
        response = Http::textResponse(200, kOffers.at(offer).name, answers.json());
        addWarnings(search, run, root, response);
        return done;
    });
    return result.good() ? std::move(response)
                         : Http::failure(503, QStringLiteral("The image database cannot be asked now"));
}

}  // namespace Kdd::DicomWeb
