#pragma once

#include "support/HttpServer.h"

#include <QByteArray>

#include <functional>
#include <string>
#include <vector>

namespace Kdd
{

/// Different at every place, so that a byte from the wrong one shows.
QByteArray someObject(int size);

/// Serves the ranges of one object as it should, as far as the test does not have it otherwise.
class ObjectServer
{
public:
    struct Answer
    {
        int code = 206;
        qint64 first, last;
        QByteArray total;
        QByteArray entityTag = "\"v1\"";
        QByteArray body;
        bool resets = false;
    };
    using Spoil = std::function<void(Answer&)>;

    explicit ObjectServer(QByteArray object, Spoil spoil = {})
        : mObject(std::move(object))
        , mSpoil(std::move(spoil))
    {
    }

    std::string origin() const { return mServer.url(""); }
    std::string url() const { return mServer.url("object"); }
    std::vector<QByteArray> requests() const { return mServer.requests(); }

private:
    ScriptedServer::Reply reply(const QByteArray& request) const;

    QByteArray mObject;
    Spoil mSpoil;
    ScriptedServer mServer{[this](const QByteArray& request) { return reply(request); }};
};

}  // namespace Kdd
