#include "server/dicomweb/search/ChangeFeed.h"

#include "server/dicomweb/search/AnswerObject.h"
#include "server/http/Compression.h"

#include <QDateTime>

#include <algorithm>

namespace Kdd::DicomWeb
{
namespace
{

constexpr int kDefaultLimit = 100;
constexpr int kGreatestLimit = 10000;

const char* nameOf(Kxg::ChangeKind kind)
{
    switch (kind) {
    case Kxg::ChangeKind::Arrived:
        return "arrived";
    case Kxg::ChangeKind::Corrected:
        return "corrected";
    case Kxg::ChangeKind::Moved:
        return "moved";
    case Kxg::ChangeKind::Deleted:
        return "deleted";
    }
    return "corrected";
}

/// An absent parameter leaves the number as it is.
bool takeNumber(const Http::Request& request, const char* name, qint64 greatest, qint64& number)
{
    const QByteArray text = request.parameter(name);
    if (text.isNull())
        return true;
    bool isNumber = false;
    const qint64 value = text.toLongLong(&isNumber);
    if (!isNumber || value < 0)
        return false;
    number = std::min(value, greatest);
    return true;
}

QByteArray jsonOf(const Kxg::StudyChangeNote& change)
{
    const QDateTime at = QDateTime::fromMSecsSinceEpoch(change.at, Qt::UTC);
    QByteArray json = "{\"position\":" + QByteArray::number(change.position) + ",\"change\":\"" +
                      nameOf(change.kind) + "\",\"study\":" + jsonText(change.studyInstanceUID) +
                      ",\"instances\":" + QByteArray::number(change.instances) +
                      ",\"time\":" + jsonText(at.toString(Qt::ISODateWithMs).toLatin1());
    // Of one that the client may not see there is no name.
    if (!change.movedFrom.isEmpty())
        json += ",\"from\":" + jsonText(change.movedFrom);
    if (!change.movedTo.isEmpty())
        json += ",\"to\":" + jsonText(change.movedTo);
    return json + '}';
}

}  // namespace

bool ChangeFeed::owns(const ResourcePath& path) const
{
    return path.resource == "changefeed" && path.study.isEmpty() && path.series.isEmpty() &&
           path.instance.isEmpty() && path.rest.isEmpty();
}

Http::Response ChangeFeed::answer(const Http::Request& request, const ResourcePath& /*path*/)
{
    qint64 after = 0;
    qint64 limit = kDefaultLimit;
    if (!takeNumber(request, "after", std::numeric_limits<qint64>::max(), after) ||
        !takeNumber(request, "limit", kGreatestLimit, limit))
        return Http::failure(400, QStringLiteral("after and limit are whole numbers"));
    std::vector<Kxg::StudyChangeNote> changes;
    qint64 last = after;
    const Result result = mDatabase.ask(request.studies, [&](Kxg::StudySearch& search) {
        return search.changes(after, static_cast<int>(limit), changes, last);
    });
    if (result.bad())
        return Http::failure(503, QStringLiteral("The image database cannot be asked now"));
    QByteArray body = "{\"changes\":[";
    for (const Kxg::StudyChangeNote& change : changes)
        body += (&change == &changes.front() ? "" : ",") + jsonOf(change);
    body += "],\"last\":" + QByteArray::number(last) + '}';
    Http::Response response = Http::textResponse(200, "application/json", body);
    Http::compress(request, response);
    return response;
}

}  // namespace Kdd::DicomWeb
