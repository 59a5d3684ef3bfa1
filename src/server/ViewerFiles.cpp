#include "server/ViewerFiles.h"

#include "server/http/AcceptHeader.h"

#include <QCryptographicHash>
#include <QFile>

#include <kddlib/PathName.h>

#include <cstdlib>
#include <memory>

namespace Kdd
{
namespace
{

const QByteArray kStartPage = "index.html";

const struct
{
    const char* suffix;
    const char* type;
} kMediaTypes[] = {
    {"css", "text/css; charset=utf-8"},
    {"gif", "image/gif"},
    {"html", "text/html; charset=utf-8"},
    {"ico", "image/x-icon"},
    {"jpeg", "image/jpeg"},
    {"jpg", "image/jpeg"},
    {"js", "text/javascript; charset=utf-8"},
    {"json", "application/json"},
    {"map", "application/json"},
    {"mjs", "text/javascript; charset=utf-8"},
    {"png", "image/png"},
    {"svg", "image/svg+xml"},
    {"ttf", "font/ttf"},
    {"txt", "text/plain; charset=utf-8"},
    {"wasm", "application/wasm"},
    {"webmanifest", "application/manifest+json"},
    {"webp", "image/webp"},
    {"woff", "font/woff"},
    {"woff2", "font/woff2"},
};

/// Null for a name that does not look like a file's.
const char* mediaTypeOf(const QByteArray& name)
{
    const int point = name.lastIndexOf('.');
    const QByteArray suffix = point < 0 ? QByteArray() : name.mid(point + 1).toLower();
    for (const auto& each : kMediaTypes)
        if (suffix == each.suffix)
            return each.type;
    return nullptr;
}

const char* typeOrBytes(const char* type)
{
    return type != nullptr ? type : "application/octet-stream";
}

/// Without links and "..", null when it does not lead to anything.
QByteArray realPath(const QByteArray& path)
{
    const std::unique_ptr<char, void (*)(void*)> real(::realpath(path.constData(), nullptr), std::free);
    return {real.get()};
}

Http::Response methodNotAllowed()
{
    Http::Response response(405);
    response.addHeader("Allow", "GET, HEAD");
    return response;
}

/// To the same address with a slash behind it, from which a page's relative addresses lead to its files.
Http::Response toFolder(const Http::Request& request)
{
    const int question = request.target.indexOf('?');
    Http::Response response(308);
    response.addHeader("Location", request.path.last() + '/' +
                                       (question < 0 ? QByteArray() : request.target.mid(question)));
    return response;
}

Http::Response fileResponse(const Http::Request& request, std::shared_ptr<const Http::OpenFile> file,
                            const char* mediaType, const char* coding = nullptr)
{
    const QByteArray hash = QCryptographicHash::hash(file->identity(), QCryptographicHash::Sha1).toHex();
    const QByteArray tag = '"' + hash + '"';
    const bool isKnown = request.header("if-none-match").contains(tag);
    Http::Response response(isKnown ? 304 : 200);
    response.addHeader("ETag", tag);
    // To be asked for each time, so that a new release of the viewer is not mixed with the old one.
    response.addHeader("Cache-Control", "no-cache");
    response.addHeader("Vary", "Accept-Encoding");
    if (isKnown)
        return response;
    response.addHeader("Content-Type", mediaType);
    if (coding != nullptr)
        response.addHeader("Content-Encoding", coding);
    const qint64 size = file->size();
    response.body.emplace_back(Http::FileRange{std::move(file), 0, size});
    return response;
}

}  // namespace

std::unique_ptr<ViewerFiles> ViewerFiles::open(const QString& folder, int prefixSegments, Result& result)
{
    const QByteArray root = realPath(pathBytes(folder));
    std::unique_ptr<ViewerFiles> files(new ViewerFiles(root, prefixSegments));
    result = {};
    if (!root.isEmpty() && files->find({kStartPage}) != nullptr)
        return files;
    result = Result::failure(QStringLiteral("there is no viewer with an index.html in it")).within(folder);
    return nullptr;
}

std::shared_ptr<const Http::OpenFile> ViewerFiles::find(const QVector<QByteArray>& segments) const
{
    QByteArray path = mRoot;
    for (const QByteArray& segment : segments)
        path += '/' + segment;
    // Links may lead anywhere; what counts is where they end.
    const QByteArray real = realPath(path);
    Result ignored;
    return real.startsWith(mRoot + '/') ? Http::OpenFile::open(real, ignored) : nullptr;
}

Http::Response ViewerFiles::answer(const Http::Request& request)
{
    if (request.method != Http::Method::Get && request.method != Http::Method::Head)
        return methodNotAllowed();
    const QVector<QByteArray> segments = request.path.mid(mPrefixSegments);
    const QByteArray path = request.target.mid(0, request.target.indexOf('?'));
    if (segments.isEmpty() && !path.endsWith('/'))
        return toFolder(request);
    const char* const type = segments.isEmpty() ? nullptr : mediaTypeOf(segments.last());
    std::shared_ptr<const Http::OpenFile> file = segments.isEmpty() ? nullptr : find(segments);
    if (file != nullptr && Http::acceptsCoding(request, "gzip")) {
        QVector<QByteArray> compressed = segments;
        compressed.last() += ".gz";
        if (auto shorter = find(compressed))
            return fileResponse(request, std::move(shorter), typeOrBytes(type), "gzip");
    }
    if (file != nullptr)
        return fileResponse(request, std::move(file), typeOrBytes(type));
    file = type == nullptr ? find({kStartPage}) : nullptr;
    if (file != nullptr)
        return fileResponse(request, std::move(file), mediaTypeOf(kStartPage));
    return Http::failure(404, QStringLiteral("The viewer has no such file"));
}

}  // namespace Kdd
