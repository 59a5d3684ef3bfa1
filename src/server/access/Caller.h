#pragma once

#include <QByteArray>
#include <QFlags>

#include <kddlib/StudyLimits.h>

#include <memory>

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
    std::shared_ptr<const Kxg::StudyLimits> studies;  ///< that he may see; null: all
    bool isByCookie = false;  ///< known by what browsers send along with whatever a page asks
};

}  // namespace Kdd::Access
