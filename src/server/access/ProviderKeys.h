#pragma once

#include "server/access/AccessRules.h"
#include "server/access/TokenKeys.h"

#include <functional>
#include <mutex>

namespace Kdd::Access
{

/// The keys of whoever issues tokens: fetched when they are first needed, again when they are old or do not know a token's
/// key, and kept for a time while they cannot be fetched. May be used on any thread.
class ProviderKeys
{
public:
    /// The text of the key set.
    using Fetch = std::function<Result(QByteArray& text)>;

    /// Seconds since 1970.
    using Clock = std::function<std::chrono::seconds()>;

    ProviderKeys(const TokenRules& rules, Fetch fetch, Clock clock);

    /// From the address or file that the rules name.
    static Fetch fetchOf(const TokenRules& rules);

    /// The keys, the same object as long as they are the same; null when there are none, or only such that are too old.
    std::shared_ptr<const TokenKeys> present();

    /// The keys when `known` did not have what was looked for: fetched again, unless that was done a moment ago. Null
    /// likewise.
    std::shared_ptr<const TokenKeys> newerThan(const std::shared_ptr<const TokenKeys>& known);

private:
    struct State
    {
        std::shared_ptr<const TokenKeys> keys;
        QByteArray text;
        std::chrono::seconds fetched{};  ///< when the keys came
        std::chrono::seconds tried{};
        bool wasTried = false;
    };

    State state() const;
    bool isOlderThan(const State& state, std::chrono::seconds age) const;
    std::shared_ptr<const TokenKeys> usable() const;
    void fetchAgain();

    const std::chrono::seconds mAge;
    const std::chrono::seconds mKept;
    const Fetch mFetch;
    const Clock mClock;
    std::mutex mFetching;  // held by the one who fetches; taken before the other
    mutable std::mutex mMutex;
    State mState;
};

}  // namespace Kdd::Access
