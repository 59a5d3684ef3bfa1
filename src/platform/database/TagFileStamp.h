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

    bool operator==(const TagFileStamp& other) const { return size == other.size && digest == other.digest; }
};

}  // namespace Kxg
