#pragma once

#include <QByteArray>
#include <QFlags>

namespace Kdd::Access
{

/// What somebody may do. Reading is all that changes nothing.
enum class Right { Read = 1, Store = 2, Correct = 4, Delete = 8 };
Q_DECLARE_FLAGS(Rights, Right)
Q_DECLARE_OPERATORS_FOR_FLAGS(Rights)

/// As access files and answers name them.
constexpr struct
{
    const char* name;
    Right right;
} kRightNames[] = {
    {"read", Right::Read}, {"store", Right::Store}, {"correct", Right::Correct}, {"delete", Right::Delete}};

/// Everything.
constexpr Rights kAllRights = Rights(Right::Read) | Right::Store | Right::Correct | Right::Delete;

/// Who asks, and what he may do.
struct Caller
{
    QByteArray subject;  ///< empty: nobody in particular
    Rights rights;
};

}  // namespace Kdd::Access
