#pragma once

#include "server/http/CacheCount.h"
#include "server/http/Exchange.h"

#include <array>
#include <atomic>
#include <functional>
#include <map>
#include <mutex>
#include <tuple>

namespace Kdd::Http
{

/// What a server counts, for a program that asks for it at intervals. May be used on any thread.
class Metrics
{
public:
    /// A number that is asked for when it is needed, on any thread, as long as this lives.
    void addGauge(const QByteArray& name, const QByteArray& help, std::function<qint64()> value);

    /// A cache that counts for itself, as long as this lives. `name` is its label.
    void addCache(const QByteArray& name, const CacheCount& count);

    /// `group` is one of few, and never made of what a client sends.
    void count(const QByteArray& group, const Exchange& exchange);

    /// All of them, as Prometheus reads them.
    QByteArray text() const;

private:
    static constexpr std::size_t kBuckets = 12;

    struct Latency
    {
        std::array<qint64, kBuckets + 1> counts{};  // the last one of those that took longer
        qint64 bytes = 0;
        double seconds = 0;
    };

    struct Gauge
    {
        QByteArray name;
        QByteArray help;
        std::function<qint64()> value;
    };

    QByteArray cachesText() const;
    QByteArray requestsText() const;
    QByteArray latencyText() const;

    mutable std::mutex mMutex;
    std::vector<Gauge> mGauges;
    std::map<QByteArray, const CacheCount*> mCaches;                  // by name
    std::map<std::tuple<QByteArray, Method, int>, qint64> mRequests;  // by group, method, status
    std::map<QByteArray, Latency> mLatencies;                         // by group
};

}  // namespace Kdd::Http
