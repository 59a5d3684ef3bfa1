#pragma once

#include <QByteArray>

namespace Kxg
{

/// By what a tag file is recognised as the one that was written last. Bytes of a longer earlier content may follow
/// those that count.
struct TagFileStamp
{
    qint64 size = 0;    ///< of what counts [bytes]
    QByteArray digest;  ///< MD5 of that; empty: never written

    /// Of the file at that moment, for noticing without opening it that it is another one now; no part of what it is.
    qint64 fileSize = 0;  ///< [bytes]
    qint64 modified = 0;  ///< [ns] since the epoch; 0: not looked at

    bool operator==(const TagFileStamp& other) const { return size == other.size && digest == other.digest; }
};

}  // namespace Kxg
