#pragma once

#include "server/http/Response.h"

#include <QString>

#include <chrono>

namespace Kdd::Http
{

/// A request and what became of it.
struct Exchange
{
    Request request;               ///< of one that could not be read only what is known
    QByteArray caller;             ///< who asked; empty where nobody knows
    std::optional<Effect> effect;  ///< what the request changed, where that is said
    int status = 0;
    qint64 bytes = 0;                      ///< sent, with the header
    std::chrono::microseconds duration{};  ///< from the whole request to the last byte handed to the system
    bool isWhole = false;                  ///< the answer; else it was broken off
    QString fault;                         ///< why we did that; empty when the client did
};

/// Is told of every exchange. Called on several threads at the same time.
class ExchangeObserver
{
public:
    virtual ~ExchangeObserver() = default;
    virtual void ended(const Exchange& exchange) = 0;
};

}  // namespace Kdd::Http
