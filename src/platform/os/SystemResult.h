#pragma once

#include "platform/base/Result.h"

#include <system_error>

namespace Kdd
{

/// A result of the operating system's: a failure also has its errno, for messages that tell the number.
class SystemResult
{
public:
    /// Done.
    SystemResult() = default;

    /// What an errno stands for, in the system's words; 0 is success.
    static SystemResult of(int error)
    {
        return error == 0 ? SystemResult() : SystemResult(Result::failure(textOf(error)), error);
    }

    /// A failure for this reason, in words that say more than those for the errno.
    static SystemResult failure(int error, const QString& reason) { return {Result::failure(reason), error}; }

    static QString textOf(int error)
    {
        return QString::fromLocal8Bit(std::system_category().message(error).c_str());
    }

    /// What callers pass on who need no number.
    operator const Result&() const { return mResult; }

    bool good() const { return mResult.good(); }
    bool bad() const { return mResult.bad(); }
    const QString& text() const { return mResult.text(); }

    /// 0 when good.
    int error() const { return mError; }

private:
    SystemResult(const Result& result, int error)
        : mResult(result)
        , mError(error)
    {
    }

    Result mResult;
    int mError = 0;
};

}  // namespace Kdd
