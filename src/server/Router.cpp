#include "server/Router.h"

#include <QList>

#include <algorithm>

namespace Kdd
{

QVector<QByteArray> Router::segmentsOf(const QByteArray& path)
{
    QVector<QByteArray> segments;
    for (const QByteArray& segment : path.split('/'))
        if (!segment.isEmpty())
            segments.append(segment);
    return segments;
}

void Router::add(const QVector<QByteArray>& beginning, std::unique_ptr<Http::Handler> handler)
{
    const auto place = std::find_if(mRoutes.begin(), mRoutes.end(), [&](const Route& route) {
        return route.beginning.size() < beginning.size();
    });
    mRoutes.insert(place, {beginning, std::move(handler)});
}

Http::Response Router::answer(const Http::Request& request)
{
    for (const Route& route : mRoutes)
        if (request.path.mid(0, route.beginning.size()) == route.beginning)
            return route.handler->answer(request);
    return Http::failure(404, QStringLiteral("Nothing has this path"));
}

}  // namespace Kdd
