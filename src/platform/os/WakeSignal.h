#pragma once

#include "platform/base/Export.h"

namespace Kdd
{

/// Something to be woken by while waiting for descriptors: a descriptor that can be read from once `wake` was called, and
/// ever after. May be used on any thread.
class WakeSignal
{
public:
    WakeSignal();
    ~WakeSignal();
    WakeSignal(const WakeSignal&) = delete;
    WakeSignal& operator=(const WakeSignal&) = delete;

    void wake() const;

    enum class Woken { ByTime, ByDescriptor, BySignal };

    /// Waits until the descriptor can be read from, or is at its end, at most `ms` [ms].
    Woken await(int descriptor, int ms) const;

private:
    const int mDescriptor;
};

}  // namespace Kdd
