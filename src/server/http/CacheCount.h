#pragma once

#include <QtGlobal>

#include <atomic>

namespace Kdd::Http
{

/// How often what was asked for was ready, and how often it had to be made or read. May be used on any thread.
struct CacheCount
{
    std::atomic<qint64> hits{0};
    std::atomic<qint64> misses{0};
};

}  // namespace Kdd::Http
