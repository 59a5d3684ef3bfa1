#include "kddlib/archive/ContentDigest.h"

#include "kddlib/net/http/ObjectAddress.h"
#include "platform/base/OrderedWork.h"
#include "platform/late/LateLibrary.h"
#include "platform/os/RandomAccessFile.h"
#include "platform/resources/ExResource.h"

#include <openssl/evp.h>

#include <algorithm>
#include <cerrno>
#include <utility>

namespace Kdd
{

namespace
{

constexpr qint64 kBlock = 1 << 20;  // [bytes]

struct FreeContext
{
    void operator()(EVP_MD_CTX* context) const { EVP_MD_CTX_free(context); }
};

DigestedFile failed(DigestedFile::Fault fault, const QString& reason = QString())
{
    DigestedFile file;
    file.fault = fault;
    file.reason = reason;
    return file;
}

}  // namespace

struct ContentDigest::Context
{
    std::unique_ptr<EVP_MD_CTX, FreeContext> digest;
};

ContentDigest::ContentDigest()
{
    if (loadLate(LateLibrary::Curl).bad())
        return;
    auto context = std::make_unique<Context>();
    context->digest.reset(EVP_MD_CTX_new());
    if (context->digest != nullptr && EVP_DigestInit_ex(context->digest.get(), EVP_sha256(), nullptr) == 1)
        mContext = std::move(context);
}

ContentDigest::~ContentDigest() = default;

void ContentDigest::add(const char* bytes, qint64 count)
{
    if (mContext != nullptr &&
        EVP_DigestUpdate(mContext->digest.get(), bytes, static_cast<std::size_t>(count)) != 1)
        mContext.reset();
}

QByteArray ContentDigest::result()
{
    QByteArray digest(EVP_MAX_MD_SIZE, Qt::Uninitialized);
    unsigned int size = 0;
    if (mContext == nullptr ||
        EVP_DigestFinal_ex(mContext->digest.get(), reinterpret_cast<unsigned char*>(digest.data()), &size) !=
            1)
        return {};
    digest.resize(static_cast<int>(size));
    return digest;
}

DigestedFile digestFile(const QByteArray& path, const BytesTaken& taken)
{
    RandomAccessFile file;
    const SystemResult opened = file.open(path.constData());
    if (opened.bad())
        return failed(opened.error() == ENOENT || opened.error() == ENOTDIR ? DigestedFile::Fault::Absent
                                                                            : DigestedFile::Fault::Unreadable,
                      opened.text());
    ContentDigest digest;
    QByteArray block(static_cast<int>(std::min(kBlock, std::max<qint64>(1, file.size()))), Qt::Uninitialized);
    // Of a file that is being written to the end is where it was when it was opened: then it is told as changing.
    for (qint64 at = 0; at < file.size();) {
        const qint64 count = file.readAt(at, block.data(), std::min<qint64>(block.size(), file.size() - at));
        if (count < 0)
            return failed(DigestedFile::Fault::Unreadable, SystemResult::textOf(errno));
        if (count == 0)
            return failed(DigestedFile::Fault::Changing);
        digest.add(block.constData(), count);
        at += count;
        if (taken && !taken(count))
            return failed(DigestedFile::Fault::Cancelled);
    }
    if (!file.isUnchanged())
        return failed(DigestedFile::Fault::Changing);
    DigestedFile read;
    read.stamp = {file.identity().size, file.identity().modified};
    read.digest = digest.result();
    if (read.digest.isEmpty())
        return failed(DigestedFile::Fault::Unreadable, loadLate(LateLibrary::Curl).text());
    return read;
}

Result digestRegistered(Kxg::Catalogue& catalogue, const Kxg::FileRecords& files)
{
    std::vector<Kxg::FileDigest> wanted;
    const auto want = [&](const QByteArray& path, const Kxg::FileStamp& stamp, bool isVolume) {
        if (!isObjectAddress(path))
            wanted.push_back({path, stamp, {}, isVolume});
    };
    if (ExResource::takesFileDigests()) {
        for (const Kxg::DicomFileRecord& file : files.dicom)
            want(file.path, file.stamp, false);
        for (const Kxg::VolumeFileRecord& file : files.volumes)
            want(file.path, file.stamp, true);
    }
    OrderedWork<QByteArray> work(static_cast<int>(wanted.size()), 0, [&wanted](int i) {
        const Kxg::FileDigest& file = wanted[static_cast<std::size_t>(i)];
        const DigestedFile read = digestFile(file.path);
        return read.fault == DigestedFile::Fault::None && read.stamp == file.stamp ? read.digest
                                                                                   : QByteArray();
    });
    std::vector<Kxg::FileDigest> digested;
    for (const Kxg::FileDigest& file : wanted) {
        QByteArray digest = work.next();
        if (!digest.isEmpty())
            digested.push_back({file.path, file.stamp, std::move(digest), file.isVolume});
    }
    return digested.empty() ? Result() : catalogue.recordDigests(digested);
}

}  // namespace Kdd
