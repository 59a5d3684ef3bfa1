#include "server/access/RightsTable.h"

#include "server/dicomweb/ResourcePath.h"

#include <algorithm>

namespace Kdd::Access
{
namespace
{

using Reach = Asked::Reach;

/// Below the prefix of DICOMweb, by the resource that a path names; "" is an object itself.
constexpr struct
{
    const char* resource;
    Http::Method method;
    Right right;
    Reach reach;
} kDicomWeb[] = {
    {"", Http::Method::Get, Right::Read, Reach::OneStudy},
    {"", Http::Method::Post, Right::Store, Reach::Limited},
    {"", Http::Method::Delete, Right::Delete, Reach::OneStudy},
    {"bulkdata", Http::Method::Get, Right::Read, Reach::OneStudy},
    {"changefeed", Http::Method::Get, Right::Read, Reach::Limited},
    {"corrections", Http::Method::Get, Right::Read, Reach::OneStudy},
    {"corrections", Http::Method::Post, Right::Correct, Reach::OneStudy},
    {"frames", Http::Method::Get, Right::Read, Reach::OneStudy},
    {"instances", Http::Method::Get, Right::Read, Reach::Limited},
    {"metadata", Http::Method::Get, Right::Read, Reach::OneStudy},
    {"patients", Http::Method::Get, Right::Read, Reach::Limited},
    {"pixeldata", Http::Method::Get, Right::Read, Reach::OneStudy},
    {"rendered", Http::Method::Get, Right::Read, Reach::OneStudy},
    {"series", Http::Method::Get, Right::Read, Reach::Limited},
    {"studies", Http::Method::Get, Right::Read, Reach::Limited},
    {"studies", Http::Method::Post, Right::Store, Reach::Limited},
    {"thumbnail", Http::Method::Get, Right::Read, Reach::OneStudy},
    {"volumes", Http::Method::Get, Right::Read, Reach::OneStudy},
    {"wado", Http::Method::Get, Right::Read, Reach::OneStudy},
};

/// Elsewhere, by the first segment; "" is the page.
constexpr struct
{
    const char* segment;
    const char* kind;
    bool isOpen;
} kPages[] = {
    {"", "page", true},           {"page", "page", true},
    {"viewer", "viewer", true},   {"browser", "browser", false},
    {"wado", "wado", false},      {"signin", "signin", true},
    {"signout", "signout", true},
};

/// The parameter that names the study in the one address without path.
constexpr const char* kUriStudy = "studyUID";

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
        asked.study =
            path.resource == "wado" && path.study.isEmpty() ? request.parameter(kUriStudy) : path.study;
        asked.verdict = Asked::Verdict::NotSo;
        if (row.method == effectOf(request.method)) {
            asked.verdict = Asked::Verdict::Needs;
            asked.right = row.right;
            asked.reach = row.reach;
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
    if (path.value(0) == "browser" && path.value(1) == "config")
        asked.reach = Reach::Nothing;
    else if (path.value(0) == "browser" && path.value(1) == "studies")
        asked.study = path.value(2);
    else if (path.value(0) == "wado")
        asked.study = request.parameter(kUriStudy);
    if (effectOf(request.method) != Http::Method::Get)
        asked.verdict = Asked::Verdict::NotSo;
    else
        asked.verdict = row->isOpen ? Asked::Verdict::Open : Asked::Verdict::Needs;
}

}  // namespace

QVector<QByteArray> RightsTable::resources()
{
    QVector<QByteArray> names;
    for (const auto& row : kDicomWeb)
        if (!names.contains(row.resource))
            names.append(row.resource);
    return names;
}

Asked RightsTable::find(const Http::Request& request) const
{
    Asked asked;
    if (request.path.mid(0, mPrefix.size()) == mPrefix)
        findDicomWeb(request, request.path.mid(mPrefix.size()), asked);
    if (asked.verdict == Asked::Verdict::Unknown)
        findPage(request, asked);
    return asked;
}

Http::Request RightsTable::withStudy(const Http::Request& request, const QByteArray& study) const
{
    Http::Request made = request;
    const QVector<QByteArray> kBrowser = {"browser"};
    for (const QVector<QByteArray>& beginning : {mPrefix, kBrowser}) {
        const int at = beginning.size() + 1;
        if (request.path.mid(0, at) != beginning + QVector<QByteArray>{"studies"} ||
            at >= request.path.size())
            continue;
        made.path[at] = study;
        return made;
    }
    const auto isStudy = [](const Http::Field& field) { return field.name == kUriStudy; };
    made.query.erase(std::remove_if(made.query.begin(), made.query.end(), isStudy), made.query.end());
    made.query.append({kUriStudy, study});
    return made;
}

}  // namespace Kdd::Access
