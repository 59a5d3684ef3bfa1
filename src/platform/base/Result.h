#pragma once

#include <QString>

namespace Kdd
{

/// Whether something was done, and if not, why: the reason, and what that was the consequence of.
class Result
{
public:
    /// Done.
    Result() = default;

    static Result failure(const QString& reason)
    {
        Result result;
        result.mReason = reason.isEmpty() ? QStringLiteral("Unknown reason") : reason;
        return result;
    }

    /// The same failure, seen by a caller: "context: reason". Success stays success.
    Result within(const QString& context) const
    {
        return good() ? *this : failure(context + QStringLiteral(": ") + mReason);
    }

    bool good() const { return mReason.isEmpty(); }
    bool bad() const { return !good(); }

    /// Empty when good.
    const QString& text() const { return mReason; }

private:
    QString mReason;
};

}  // namespace Kdd
