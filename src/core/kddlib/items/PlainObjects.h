#pragma once

#include "kddlib/items/PlainFiles.h"
#include "platform/base/OrderedWork.h"
#include "platform/base/Result.h"
#include "platform/database/Catalogue.h"

#include <QByteArray>
#include <QHash>
#include <QList>

#include <memory>

namespace Kdd
{

class RemoteFile;

/// An object behind a URL that was looked at by `readPlainFile`.
struct ObjectRead
{
    /// Of the object: its size, and its version (`RemoteFile::version`) in place of the time. Without a known version it
    /// is never the one that was known.
    Kxg::FileStamp stamp;

    Result fault;              ///< why it cannot be had, or not all of what was asked for
    bool isUnchanged = false;  ///< as it was known; nothing else was read
    bool isPlain = false;
    PlainImage image;
    std::shared_ptr<RemoteFile> file;  ///< of one that is not plain, to be read otherwise
};

/// Reads objects behind URLs by their headers, many at once over as many connections, ahead of being asked for. Used by
/// one thread.
class PlainObjects
{
public:
    /// Of those that are `known` by their URL it is asked first whether they still are what they were, which costs one
    /// byte.
    PlainObjects(QList<QByteArray> urls, QHash<QByteArray, Kxg::FileStamp> known, unsigned int maxLength);

    /// What the next object is; to be called once for each URL, in their order.
    ObjectRead next() { return mWork.next(); }

private:
    const QList<QByteArray> mUrls;
    const QHash<QByteArray, Kxg::FileStamp> mKnown;
    OrderedWork<ObjectRead> mWork;  // last, because its threads use the rest
};

/// The same for one object.
ObjectRead readObject(const QByteArray& url, unsigned int maxLength);

}  // namespace Kdd
