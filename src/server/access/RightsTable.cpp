#include "server/access/RightsTable.h"

#include "server/dicomweb/ResourcePath.h"

#include <algorithm>

namespace Kdd::Access
{
namespace
{

/// Below the prefix of DICOMweb, by the resource that a path names; "" is an object itself.
constexpr struct
{
    const char* resource;
    Http::Method method;
    Right right;
} kDicomWeb[] = {
    {"", Http::Method::Get, Right::Read},
    {"", Http::Method::Post, Right::Store},
    {"", Http::Method::Delete, Right::Delete},
    {"bulkdata", Http::Method::Get, Right::Read},
    {"changefeed", Http::Method::Get, Right::Read},
    {"corrections", Http::Method::Get, Right::Read},
    {"corrections", Http::Method::Post, Right::Correct},
    {"frames", Http::Method::Get, Right::Read},
    {"instances", Http::Method::Get, Right::Read},
    {"metadata", Http::Method::Get, Right::Read},
    {"patients", Http::Method::Get, Right::Read},
    {"pixeldata", Http::Method::Get, Right::Read},
    {"rendered", Http::Method::Get, Right::Read},
    {"series", Http::Method::Get, Right::Read},
    {"studies", Http::Method::Get, Right::Read},
    {"studies", Http::Method::Post, Right::Store},
    {"thumbnail", Http::Method::Get, Right::Read},
    {"volumes", Http::Method::Get, Right::Read},
    {"wado", Http::Method::Get, Right::Read},
};

/// Elsewhere, by the first segment; "" is the page.
constexpr struct
{
    const char* segment;
    const char* kind;
    bool isOpen;
} kPages[] = {
    {"", "page", true},         {"page", "page", true},
    {"viewer", "viewer", true}, {"browser", "browser", false},
    {"wado", "wado", false},
};

/// HEAD tells what GET does, and OPTIONS what there is to ask for.
Http::Method effectOf(Http::Method method)
{
    return method == Http::Method::Head || method == Http::Method::Options ? Http::Method::Get : method;
}

void findDicomWeb(const Http::Request& request, const QVector<QByteArray>& segments, Asked& asked)
{
    DicomWeb::ResourcePath path;
    if (!DicomWeb::ResourcePath::parse(segments, path))
        return;
    for (const auto& row : kDicomWeb) {
        if (path.resource != row.resource)
            continue;
        asked.kind = *row.resource == '\0' ? "objects" : row.resource;
        asked.study = path.resource == "wado" ? request.parameter("studyUID") : path.study;
        asked.verdict = Asked::Verdict::NotSo;
        if (row.method == effectOf(request.method)) {
            asked.verdict = Asked::Verdict::Needs;
            asked.right = row.right;
            return;
        }
    }
}

void findPage(const Http::Request& request, Asked& asked)
{
    const QVector<QByteArray>& path = request.path;
    const auto* const row = std::find_if(std::begin(kPages), std::end(kPages),
                                         [&](const auto& each) { return path.value(0) == each.segment; });
    if (row == std::end(kPages))
        return;
    asked.kind = row->kind;
    if (path.value(0) == "browser" && path.value(1) == "studies")
        asked.study = path.value(2);
    else if (path.value(0) == "wado")
        asked.study = request.parameter("studyUID");
    if (effectOf(request.method) != Http::Method::Get)
        asked.verdict = Asked::Verdict::NotSo;
    else
        asked.verdict = row->isOpen ? Asked::Verdict::Open : Asked::Verdict::Needs;
}

}  // namespace

Asked RightsTable::find(const Http::Request& request) const
{
    Asked asked;
    if (request.path.mid(0, mPrefix.size()) == mPrefix)
        findDicomWeb(request, request.path.mid(mPrefix.size()), asked);
    if (asked.verdict == Asked::Verdict::Unknown)
        findPage(request, asked);
    return asked;
}

}  // namespace Kdd::Access
