#pragma once

#include "server/http/HttpServer.h"

#include <condition_variable>
#include <functional>
#include <mutex>
#include <stdexcept>
#include <vector>

namespace Kdd
{

/// Settings of which one is as a test wants it: with(&Http::HttpSettings::requests, 1).
template <typename Value, typename Given>
Http::HttpSettings with(Value Http::HttpSettings::*setting, Given value)
{
    Http::HttpSettings settings;
    settings.*setting = value;
    return settings;
}

/// An answer whose body is this part.
template <typename Part>
Http::Response answerOf(Part part)
{
    Http::Response response(200);
    response.body.emplace_back(std::move(part));
    return response;
}

/// A server on a free port that answers by a function and keeps what it was told of.
class RunningServer : private Http::Handler, private Http::ExchangeObserver
{
public:
    using Answer = std::function<Http::Response(const Http::Request&)>;

    explicit RunningServer(Answer answer, Http::HttpSettings settings = {})
        : mAnswer(std::move(answer))
        , mServer(anyPort(settings), *this, *this)
    {
        const Result started = mServer.start();
        if (started.bad())
            throw std::runtime_error(started.text().toStdString());
    }
    ~RunningServer() override { mServer.stop(); }

    Http::HttpServer& http() { return mServer; }
    QByteArray address() const { return mServer.address(); }

    /// As soon as so many exchanges have ended.
    std::vector<Http::Exchange> exchanges(std::size_t count)
    {
        std::unique_lock<std::mutex> lock(mMutex);
        mChanged.wait(lock, [&] { return mExchanges.size() >= count; });
        return mExchanges;
    }

private:
    static Http::HttpSettings anyPort(Http::HttpSettings settings)
    {
        settings.address = {"127.0.0.1", 0};
        return settings;
    }

    Http::Response answer(const Http::Request& request) override { return mAnswer(request); }

    void ended(const Http::Exchange& exchange) override
    {
        const std::lock_guard<std::mutex> lock(mMutex);
        mExchanges.push_back(exchange);
        mChanged.notify_all();
    }

    Answer mAnswer;
    std::mutex mMutex;
    std::condition_variable mChanged;
    std::vector<Http::Exchange> mExchanges;
    Http::HttpServer mServer;
};

/// Holds threads up until it is opened.
class Gate
{
public:
    /// Tells that a thread has come, and waits.
    void pass()
    {
        std::unique_lock<std::mutex> lock(mMutex);
        ++mWaiting;
        mChanged.notify_all();
        mChanged.wait(lock, [this] { return mIsOpen; });
    }

    void awaitThread()
    {
        std::unique_lock<std::mutex> lock(mMutex);
        mChanged.wait(lock, [this] { return mWaiting > 0; });
    }

    void open()
    {
        const std::lock_guard<std::mutex> lock(mMutex);
        mIsOpen = true;
        mChanged.notify_all();
    }

private:
    std::mutex mMutex;
    std::condition_variable mChanged;
    int mWaiting = 0;
    bool mIsOpen = false;
};

}  // namespace Kdd
