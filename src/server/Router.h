#pragma once

#include "server/http/Response.h"

#include <QVector>

#include <memory>
#include <vector>

namespace Kdd
{

/// Hands each request to whoever answers for the beginning of its path.
class Router : public Http::Handler
{
public:
    /// "/dicom-web" is one segment, "/" none.
    static QVector<QByteArray> segmentsOf(const QByteArray& path);

    /// Of several that fit the longest counts.
    void add(const QVector<QByteArray>& beginning, std::unique_ptr<Http::Handler> handler);

    /// 404 where nobody answers.
    Http::Response answer(const Http::Request& request) override;

private:
    struct Route
    {
        QVector<QByteArray> beginning;
        std::unique_ptr<Http::Handler> handler;
    };

    std::vector<Route> mRoutes;  // the longer ones first
};

}  // namespace Kdd
