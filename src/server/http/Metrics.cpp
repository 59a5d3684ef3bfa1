#include "server/http/Metrics.h"

#include <algorithm>

namespace Kdd::Http
{
namespace
{

/// From an answer out of memory to one that nobody waits for [s].
constexpr std::array<double, 12> kBounds = {0.001, 0.0025, 0.005, 0.01, 0.025, 0.05,
                                            0.1,   0.25,   0.5,   1,    2.5,   10};

QByteArray heading(const QByteArray& name, const QByteArray& help, const char* type)
{
    return "# HELP " + name + ' ' + help + "\n# TYPE " + name + ' ' + type + '\n';
}

QByteArray line(const QByteArray& name, const QByteArray& label, const QByteArray& value)
{
    return name + (label.isEmpty() ? QByteArray() : '{' + label + '}') + ' ' + value + '\n';
}

}  // namespace

void Metrics::addGauge(const QByteArray& name, const QByteArray& help, std::function<qint64()> value)
{
    const std::lock_guard<std::mutex> lock(mMutex);
    mGauges.push_back({name, help, std::move(value)});
}

void Metrics::addCache(const QByteArray& name, const CacheCount& count)
{
    const std::lock_guard<std::mutex> lock(mMutex);
    mCaches[name] = &count;
}

void Metrics::count(const QByteArray& group, const Exchange& exchange)
{
    const double seconds = std::chrono::duration<double>(exchange.duration).count();
    const auto* const bound = std::lower_bound(kBounds.begin(), kBounds.end(), seconds);
    const std::lock_guard<std::mutex> lock(mMutex);
    ++mRequests[{group, exchange.request.method, exchange.status}];
    Latency& latency = mLatencies[group];
    ++latency.counts[static_cast<std::size_t>(bound - kBounds.begin())];
    latency.bytes += exchange.bytes;
    latency.seconds += seconds;
}

QByteArray Metrics::requestsText() const
{
    QByteArray text = heading("kdd_http_requests_total", "Requests that were answered.", "counter");
    for (const auto& [key, value] : mRequests) {
        const auto& [group, method, status] = key;
        text += line("kdd_http_requests_total",
                     "route=\"" + group + "\",method=\"" + nameOf(method) + "\",status=\"" +
                         QByteArray::number(status) + '"',
                     QByteArray::number(value));
    }
    text += heading("kdd_http_response_bytes_total", "Bytes sent, with headers.", "counter");
    for (const auto& [group, latency] : mLatencies)
        text += line("kdd_http_response_bytes_total", "route=\"" + group + '"',
                     QByteArray::number(latency.bytes));
    return text;
}

QByteArray Metrics::latencyText() const
{
    const QByteArray name = "kdd_http_request_duration_seconds";
    QByteArray text = heading(name, "From the whole request to the last byte sent.", "histogram");
    for (const auto& [group, latency] : mLatencies) {
        const QByteArray route = "route=\"" + group + '"';
        qint64 sum = 0;
        for (std::size_t i = 0; i <= kBounds.size(); ++i) {
            sum += latency.counts[i];
            const QByteArray bound = i < kBounds.size() ? QByteArray::number(kBounds[i]) : "+Inf";
            text += line(name + "_bucket", route + ",le=\"" + bound + '"', QByteArray::number(sum));
        }
        text += line(name + "_sum", route, QByteArray::number(latency.seconds, 'f', 6));
        text += line(name + "_count", route, QByteArray::number(sum));
    }
    return text;
}

QByteArray Metrics::cachesText() const
{
    QByteArray hits = heading("kdd_cache_hits_total", "What was asked for and ready.", "counter");
    QByteArray misses =
        heading("kdd_cache_misses_total", "What was asked for and had to be made or read.", "counter");
    for (const auto& [name, count] : mCaches) {
        const QByteArray label = "cache=\"" + name + '"';
        hits += line("kdd_cache_hits_total", label, QByteArray::number(count->hits.load()));
        misses += line("kdd_cache_misses_total", label, QByteArray::number(count->misses.load()));
    }
    return hits + misses;
}

QByteArray Metrics::text() const
{
    const std::lock_guard<std::mutex> lock(mMutex);
    QByteArray text = requestsText() + latencyText() + cachesText();
    for (const Gauge& gauge : mGauges)
        text += heading(gauge.name, gauge.help, "gauge") +
                line(gauge.name, {}, QByteArray::number(gauge.value()));
    return text;
}

}  // namespace Kdd::Http
