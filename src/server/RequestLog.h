#pragma once

#include "server/http/Exchange.h"
#include "server/http/Metrics.h"

namespace Kdd
{

/// Counts every request, and writes a line into the log for each that failed or took long. Values of a query stay out of
/// both: they can be names.
class RequestLog : public Http::ExchangeObserver
{
public:
    /// `prefix` leads to DICOMweb, `slow` is what counts as long.
    RequestLog(Http::Metrics& metrics, const QVector<QByteArray>& prefix, std::chrono::milliseconds slow)
        : mMetrics(metrics)
        , mPrefix(prefix)
        , mSlow(slow)
    {
    }

    void ended(const Http::Exchange& exchange) override;

private:
    QByteArray groupOf(const QVector<QByteArray>& path) const;

    Http::Metrics& mMetrics;
    QVector<QByteArray> mPrefix;
    std::chrono::milliseconds mSlow;
};

}  // namespace Kdd
