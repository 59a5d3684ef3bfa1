#include "server/browser/BrowserService.h"

#include "server/browser/CorrectionJson.h"
#include "server/browser/PageAnswer.h"
#include "server/browser/StudyAnswer.h"
#include "server/browser/StudySizes.h"
#include "server/dicomweb/ResourcePath.h"

#include <QJsonArray>

#include <kddlib/TagFile.h>

namespace Kdd::Browser
{
namespace
{

constexpr const char* kMethods = "GET, HEAD, OPTIONS";

// The page and its modules, and nothing else: no script or style inside the page, none from elsewhere, and no text that
// becomes markup. What a value of a DICOM file says is then only ever shown.
constexpr const char* kPolicy =
    "default-src 'none'; script-src 'self'; style-src 'self'; img-src 'self'; "
    "connect-src 'self'; base-uri 'none'; form-action 'none'; frame-ancestors 'none'; "
    "require-trusted-types-for 'script'; trusted-types 'none'";

void addSafety(Http::Response& response)
{
    response.addHeader("Content-Security-Policy", kPolicy);
    response.addHeader("Referrer-Policy", "no-referrer");
    response.addHeader("Cross-Origin-Resource-Policy", "same-origin");
    response.addHeader("X-Frame-Options", "DENY");
}

Http::Response methodsOnly(int status)
{
    Http::Response response(status);
    response.addHeader("Allow", kMethods);
    return response;
}

Http::Response notFound()
{
    return Http::failure(404, QStringLiteral("The study browser has nothing under this path"));
}

}  // namespace

BrowserService::BrowserService(DicomWeb::StudyShelf& shelf, const BrowserSettings& settings)
    : mShelf(shelf)
    , mSettings(settings)
{
}

Http::Response BrowserService::answer(const Http::Request& request)
{
    const bool isRead = request.method == Http::Method::Get || request.method == Http::Method::Head;
    Http::Response response =
        isRead ? find(request) : methodsOnly(request.method == Http::Method::Options ? 204 : 405);
    addSafety(response);
    return response;
}

Http::Response BrowserService::find(const Http::Request& request) const
{
    const QVector<QByteArray>& path = request.path;
    if (path.isEmpty())
        return pageAnswer(request, "index.html");
    if (path.size() == 2 && path[0] == "page")
        return pageAnswer(request, path[1]);
    if (path.size() == 2 && path[0] == "browser" && path[1] == "config")
        return config(request);
    if (path.size() >= 3 && path[0] == "browser" && path[1] == "studies" && DicomWeb::isUID(path[2]))
        return study(request, path[2], path.mid(3));
    return notFound();
}

Http::Response BrowserService::config(const Http::Request& request) const
{
    QJsonArray may;
    for (const QByteArray& right : mSettings.changes)
        if (request.rights.contains(right))
            may.append(QString::fromLatin1(right));
    return jsonAnswer(request, {{QStringLiteral("dicomWeb"), QString::fromUtf8(mSettings.dicomWeb)},
                                {QStringLiteral("viewer"), mSettings.hasViewer},
                                {QStringLiteral("signIn"), mSettings.hasSignIn},
                                {QStringLiteral("thumbnails"), mSettings.hasThumbnails},
                                {QStringLiteral("may"), may},
                                {QStringLiteral("caller"), QString::fromUtf8(request.caller)}});
}

Http::Response BrowserService::lookAt(const QByteArray& uid, const Look& look) const
{
    std::shared_ptr<const DicomWeb::ServedStudy> study;
    DicomWeb::Arrivals* const arrivals = mShelf.arrivals();
    // Whoever uploads looks at once at what came of it.
    if (arrivals != nullptr)
        arrivals->bringInOwn(uid);
    DicomWeb::Presence presence = DicomWeb::Presence::Absent;
    const auto isThere = [&] {
        presence = mShelf.find(uid, study);
        return presence == DicomWeb::Presence::Held || study != nullptr;
    };
    if (DicomWeb::isLackingAfter(isThere, uid, arrivals))
        presence = DicomWeb::Presence::Held;
    if (presence != DicomWeb::Presence::Found)
        return DicomWeb::verdictOn(presence).response();
    return study->look([&](const TagFile& file) { return look(file, study->version()); });
}

Http::Response BrowserService::sizes(const Http::Request& request, const QByteArray& uid) const
{
    StudyFiles files;
    Http::Response response = lookAt(uid, [&](const TagFile& file, const QByteArray&) {
        files = filesOf(file);
        return Http::Response();
    });
    // The files are looked at when others may have the tree again: there can be thousands, on a slow disk.
    return response.status == 200 ? jsonAnswer(request, sizesJson(files)) : std::move(response);
}

Http::Response BrowserService::study(const Http::Request& request, const QByteArray& uid,
                                     const Rest& rest) const
{
    if (rest == Rest{"sizes"})
        return sizes(request, uid);
    return lookAt(uid, [&](const TagFile& file, const QByteArray& version) {
        if (rest.isEmpty())
            return jsonAnswer(request, studyJson(file));
        if (rest == Rest{"corrections"})
            return jsonAnswer(request, correctionsOf(file));
        if (rest == Rest{"difference"})
            return differenceAnswer(request, file);
        if (rest == Rest{"preview"})
            return studyPreview(request, file, version);
        if (rest.size() >= 3 && rest[0] == "series")
            return seriesAnswer(request, file, version, rest.mid(1));
        if (rest.size() == 3 && rest[0] == "images")
            return imageAnswer(request, file, version, rest.mid(1));
        return notFound();
    });
}

}  // namespace Kdd::Browser
