#pragma once

#include "server/dicomweb/change/ChangeRules.h"

#include <atomic>

namespace Kdd::DicomWeb
{

/// Lets so many change something at a time as the rules say, so that there is always somebody for the others: a change can
/// take long. May be used on any thread.
class Turns
{
public:
    explicit Turns(const ChangeRules& rules)
        : mRules(rules)
    {
    }

    const ChangeRules& rules() const { return mRules; }

private:
    friend class Turn;
    const ChangeRules mRules;
    std::atomic<int> mCount{0};
};

/// One of them, until its end. False: there was none left.
class Turn
{
public:
    explicit Turn(Turns& turns)
        : mTurns(turns)
        , mIsTaken(++turns.mCount <= turns.mRules.most)
    {
    }
    ~Turn() { --mTurns.mCount; }
    Turn(const Turn&) = delete;
    Turn& operator=(const Turn&) = delete;

    explicit operator bool() const { return mIsTaken; }

private:
    Turns& mTurns;
    const bool mIsTaken;
};

}  // namespace Kdd::DicomWeb
