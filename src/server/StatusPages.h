#pragma once

#include "server/http/Metrics.h"
#include "server/http/Response.h"

namespace Kdd
{

/// For those who watch the server: /healthz (it is alive), /readyz (it can answer), /metrics.
class StatusPages : public Http::Handler
{
public:
    /// `metrics` outlive this.
    explicit StatusPages(const Http::Metrics& metrics)
        : mMetrics(metrics)
    {
    }

    Http::Response answer(const Http::Request& request) override;

private:
    const Http::Metrics& mMetrics;
};

}  // namespace Kdd
