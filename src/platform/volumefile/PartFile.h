#pragma once

#include "platform/base/Result.h"
#include "platform/volumefile/FileDriver.h"

#include <QByteArray>

#include <cstddef>

namespace Kdd::VolumeFile
{

/// A file that is written under a passing name beside its target, and gets its name when it is whole. What is not
/// published is removed with the object.
///
/// The first error of the system is kept, and everything after it is dropped in silence: the HDF5 library cannot close
/// a file that it cannot write, and brings the process down when that ends. So it is not told; whoever writes asks.
class PartFile final : public ByteStore
{
public:
    PartFile() = default;
    ~PartFile() override;
    PartFile(const PartFile&) = delete;
    PartFile& operator=(const PartFile&) = delete;

    /// To be called once.
    Result create(const QByteArray& target);

    /// Always true; state() tells what became of it.
    bool write(qint64 at, const void* bytes, std::size_t size) override;
    bool truncate(qint64 size) override;

    /// Zeros where nothing was written.
    bool read(qint64 at, void* bytes, std::size_t size) override;

    qint64 size() const override { return mSize; }

    /// Whether all was written until now.
    Result state() const;

    /// Gives the file its name, in place of another file that may bear it. All was handed to the system, which need not have
    /// it on the disk yet.
    Result publish();

private:
    void fail(int error);

    QByteArray mTarget;
    QByteArray mPath;  // empty when there is no such file
    int mDescriptor = -1;
    int mError = 0;
    qint64 mSize = 0;
};

}  // namespace Kdd::VolumeFile
