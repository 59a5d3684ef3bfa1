#pragma once

#include "server/http/Response.h"

#include <kddlib/Result.h>

#include <memory>

namespace Kdd
{

/// The static files of a viewer: what lies below one folder, and nothing else. A viewer makes up addresses of its own,
/// so a path that names no file gets the start page, unless it looks like a file's.
class ViewerFiles : public Http::Handler
{
public:
    /// Null, with the reason in `result`, when there is no folder with an index.html.
    static std::unique_ptr<ViewerFiles> open(const QString& folder, int prefixSegments, Result& result);

    Http::Response answer(const Http::Request& request) override;

private:
    ViewerFiles(const QByteArray& root, int prefixSegments)
        : mRoot(root)
        , mPrefixSegments(prefixSegments)
    {
    }

    std::shared_ptr<const Http::OpenFile> find(const QVector<QByteArray>& segments) const;

    QByteArray mRoot;  // without links on the way
    int mPrefixSegments;
};

}  // namespace Kdd
