#include "server/access/ProviderKeys.h"

#include <QFile>

#include <kddlib/KxCurlClient.h>
#include <kddlib/LogFile.h>
#include <kddlib/PathName.h>

namespace Kdd::Access
{
namespace
{

constexpr qint64 kLongestKeySet = 1024 * 1024;  // [bytes]

/// Requests wait for the first keys, so that a provider which does not answer must not hold them long; nor may anybody
/// who sends names of keys that do not exist make us ask it without end.
constexpr auto kPatience = std::chrono::seconds(5);
constexpr auto kPause = std::chrono::seconds(10);

Result readKeyFile(const QByteArray& path, QByteArray& text)
{
    QFile file(pathText(path));
    if (!file.open(QIODevice::ReadOnly))
        return Result::failure(file.errorString()).within(pathText(path));
    text = file.read(kLongestKeySet);
    return {};
}

}  // namespace

ProviderKeys::ProviderKeys(const TokenRules& rules, Fetch fetch, Clock clock)
    : mAge(rules.keysAge)
    , mKept(rules.keysKept)
    , mFetch(std::move(fetch))
    , mClock(std::move(clock))
{
}

ProviderKeys::Fetch ProviderKeys::fetchOf(const TokenRules& rules)
{
    const QByteArray place = rules.keys;
    if (!place.contains("://"))
        return [place](QByteArray& text) { return readKeyFile(place, text); };
    return [place, caFile = rules.caFile](QByteArray& text) {
        return KxCurlClient::instance().readTrusted(place.toStdString(), caFile, kLongestKeySet, kPatience,
                                                    text);
    };
}

ProviderKeys::State ProviderKeys::state() const
{
    const std::lock_guard<std::mutex> lock(mMutex);
    return mState;
}

bool ProviderKeys::isOlderThan(const State& state, std::chrono::seconds age) const
{
    return state.keys == nullptr || mClock() - state.fetched >= age;
}

std::shared_ptr<const TokenKeys> ProviderKeys::usable() const
{
    const State now = state();
    return isOlderThan(now, mKept) ? nullptr : now.keys;
}

std::shared_ptr<const TokenKeys> ProviderKeys::present()
{
    const State now = state();
    if (!isOlderThan(now, mAge))
        return now.keys;
    std::unique_lock<std::mutex> fetching(mFetching, std::defer_lock);
    // While the known ones serve nobody but the one who fetches waits.
    if (isOlderThan(now, mKept))
        fetching.lock();
    else if (!fetching.try_lock())
        return now.keys;
    if (isOlderThan(state(), mAge))
        fetchAgain();
    return usable();
}

std::shared_ptr<const TokenKeys> ProviderKeys::newerThan(const std::shared_ptr<const TokenKeys>& known)
{
    const std::lock_guard<std::mutex> fetching(mFetching);
    if (state().keys == known)
        fetchAgain();
    return usable();
}

/// With `mFetching` held.
void ProviderKeys::fetchAgain()
{
    State next = state();
    const std::chrono::seconds now = mClock();
    if (next.wasTried && now - next.tried < kPause)
        return;
    next.tried = now;
    next.wasTried = true;
    QByteArray text;
    Result result = mFetch(text);
    std::shared_ptr<const TokenKeys> keys = next.keys;
    if (result.good() && text != next.text)
        keys = TokenKeys::read(text, result);
    if (result.good()) {
        next.keys = keys;
        next.text = text;
        next.fetched = now;
    } else {
        LogFile::errorf("The keys that tokens are signed with cannot be had: %s",
                        qUtf8Printable(result.text()));
    }
    const std::lock_guard<std::mutex> lock(mMutex);
    mState = next;
}

}  // namespace Kdd::Access
