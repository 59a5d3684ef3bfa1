#pragma once

#include "platform/base/Export.h"
#include "platform/base/Result.h"

#include <QByteArray>
#include <QString>

namespace Kdd
{

/// What the server computed and may need again, by name, in a folder that any number of processes share.
///
/// An entry is always whole: it is replaced as one, and readers see the old bytes or the new ones. Names are any bytes;
/// what they say never leads out of the folder. An entry that is not there is no fault, for anybody may remove any
/// entry at any time. Nothing bounds the folder but those who remove.
///
/// Each object is used by one thread at a time.
class KDD_EXPORT ExFileCache
{
public:
    /// Opens the cache in `folder`, which is made when it is absent; null stands for the site's setting. Failure: none
    /// is set, or the folder cannot be made or is not writable. To be called first; until it succeeds, nothing is
    /// stored or found.
    Result init(const char* folder = nullptr);

    /// Adds or replaces an entry. On failure the former entry is still there.
    Result storeBuffer(const QByteArray& name, const QByteArray& bytes) const;

    /// False, with `bytes` as they were, when there is no such entry or it cannot be read.
    bool readBuffer(const QByteArray& name, QByteArray& bytes) const;

    /// True when there is no such entry any more.
    bool removeBuffer(const QByteArray& name) const;

private:
    QString pathOf(const QByteArray& name) const;

    QString mFolder;
};

}  // namespace Kdd
