#include "server/Server.h"

#include "server/Resources.h"
#include "server/Router.h"
#include "server/dicomweb/DicomWebService.h"
#include "server/http/HttpServer.h"

namespace Kdd
{
namespace
{

class Unobserved : public Http::ExchangeObserver
{
public:
    void ended(const Http::Exchange& /*exchange*/) override {}
};

}  // namespace

struct Server::Private
{
    explicit Private(const ServerSettings& settings)
        : http(settings.http, router, observer)
    {
        const QVector<QByteArray> prefix = Router::segmentsOf(settings.prefix);
        router.add(prefix, std::make_unique<DicomWeb::DicomWebService>(prefix.size(), makeResources()));
    }

    Router router;
    Unobserved observer;
    Http::HttpServer http;
};

Server::Server(const ServerSettings& settings)
    : d(std::make_unique<Private>(settings))
{
}

Server::~Server() = default;

Result Server::start()
{
    return d->http.start();
}

void Server::stop()
{
    d->http.stop();
}

QByteArray Server::address() const
{
    return d->http.address();
}

}  // namespace Kdd
