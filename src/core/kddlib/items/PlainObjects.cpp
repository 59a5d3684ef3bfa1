#include "kddlib/items/PlainObjects.h"

#include "kddlib/items/PlainSource.h"
#include "kddlib/net/dicom/RemoteDicom.h"
#include "kddlib/net/dicom/RemoteFile.h"
#include "kddlib/tagmodel/TagMap.h"

#include <utility>

namespace Kdd
{

namespace
{

class RemoteSource : public PlainSource
{
public:
    explicit RemoteSource(RemoteFile& file)
        : mFile(file)
    {
    }

    qint64 size() const override { return mFile.size(); }
    qint64 readAt(qint64 offset, void* bytes, qint64 count) override
    {
        return mFile.readAt(offset, bytes, count);
    }
    bool isUnchanged() override { return mFile.fault().good(); }

private:
    RemoteFile& mFile;
};

/// `known` is null when nothing is.
ObjectRead read(const QByteArray& url, const Kxg::FileStamp* known, unsigned int maxLength)
{
    ObjectRead read;
    const std::shared_ptr<RemoteFile> file =
        RemoteFile::open(url, known != nullptr ? 1 : kRemoteHead, read.fault);
    if (file == nullptr)
        return read;
    read.stamp = {file->size(), file->version()};
    read.isUnchanged = known != nullptr && file->version() != 0 && *known == read.stamp;
    if (read.isUnchanged)
        return read;
    RemoteSource source(*file);
    const bool isPlain = readPlainFile(source, maxLength, read.image);
    read.fault = file->fault();
    read.isPlain = isPlain && read.fault.good();
    if (!isPlain && read.fault.good())
        read.file = file;
    return read;
}

}  // namespace

PlainObjects::PlainObjects(QList<QByteArray> urls, QHash<QByteArray, Kxg::FileStamp> known,
                           unsigned int maxLength)
    : mUrls(std::move(urls))
    , mKnown(std::move(known))
    , mWork(
          mUrls.size(), kRemoteFilesAtOnce,
          [this, maxLength](int i) {
              const auto found = mKnown.constFind(mUrls.at(i));
              return read(mUrls.at(i), found != mKnown.cend() ? &*found : nullptr, maxLength);
          },
          ThreadShare::Of::Waiting)
{
}

ObjectRead readObject(const QByteArray& url, unsigned int maxLength)
{
    return read(url, nullptr, maxLength);
}

}  // namespace Kdd
