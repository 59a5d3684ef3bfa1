// What clients ask searches for.

#include "fuzz/Property.h"
#include "server/dicomweb/search/SearchPlan.h"

#include <kddlib/SearchText.h>

using namespace Kdd;
using namespace Kdd::DicomWeb;

namespace
{

/// Every attribute has the same value.
class OneValue : public AttributeSource
{
public:
    explicit OneValue(QString value)
        : mValue(std::move(value))
    {
    }
    QStringList values(const QVector<DcmTagKey>& /*path*/) const override { return {mValue}; }

private:
    QString mValue;
};

void checkSearch(const QVector<Http::Field>& query, const char* resource)
{
    ResourcePath path;
    SearchRequest request;
    require(ResourcePath::parse({"studies", "1.2", resource}, path), "the path is one");
    require(SearchRequest::takePath(path, request), "it is a search");
    SearchPlan plan;
    QString reason;
    if (!SearchRequest::parse(query, request, reason) || !SearchPlan::make(request, plan, reason)) {
        require(!reason.isEmpty(), "a refusal has a reason");
        return;
    }
    require(request.limit >= 0 && request.offset >= 0, "pages are not negative");
    require(plan.isNarrowed, "the study of the path narrows every search");
    Conditions all;
    for (const SearchCondition& condition : request.conditions) {
        require(!condition.path.isEmpty() && !condition.list.isEmpty(), "a condition asks for something");
        all.push_back(&condition);
    }
    // What is looked at once more is a part of what was asked.
    require(plan.onStudy.size() + plan.onSeries.size() + plan.onImages.size() <= all.size(),
            "no condition is made up");
    for (const Http::Field& field : query)
        holdAll(all, OneValue(QString::fromUtf8(field.value)), request);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, std::size_t size)
{
    QVector<Http::Field> query;
    for (const QByteArray& field : bytesOf(data, size).split('&')) {
        const int equals = field.indexOf('=');
        query.append({field.left(equals), field.mid(equals + 1)});
    }
    checkSearch(query, "series");
    checkSearch(query, "instances");
    return 0;
}
