#pragma once

#include <QByteArray>

namespace Kdd::Dimse
{

/// What stands before a dataset in a file.
struct MetaHeader
{
    QByteArray sopClass;
    QByteArray sopInstance;
    QByteArray transferSyntax;  ///< UID
    QByteArray sender;          ///< application entity title

    /// Preamble, prefix and meta information.
    QByteArray bytes() const;
};

}  // namespace Kdd::Dimse
