#include "server/Server.h"

#include "server/Resources.h"
#include "server/Router.h"
#include "server/browser/BrowserService.h"
#include "server/dicomweb/DicomWebService.h"
#include "server/http/HttpServer.h"

namespace Kdd
{
namespace
{

// The trees of some hundred studies [bytes].
constexpr qint64 kShelfCapacity = qint64(64) * 1024 * 1024;

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
        Browser::BrowserSettings browser;
        browser.dicomWeb = prefix.toList().join('/');
        router.add({}, std::make_unique<Browser::BrowserService>(shelf, browser));
    }

    DicomWeb::StudyShelf shelf{kShelfCapacity};

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
