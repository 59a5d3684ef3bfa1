#pragma once

#include "kddlib/tagfile/TagFile.h"

#include <QStringList>
#include <QTemporaryDir>

#include <memory>
#include <string>
#include <vector>

namespace Kdd
{

/// A computed tomography study on disk, one file an image with about 150 attributes, in a folder that goes with it.
class Workload
{
public:
    explicit Workload(int images);

    const std::vector<std::string>& files() const { return mFiles; }

    /// Bytes of all files without their pixel data.
    qint64 headerBytes() const { return mHeaderBytes; }

    /// The study's images in memory, `count` of them: those of the files and, beyond their number, copies that differ
    /// in what differs between the slices of a stack.
    std::unique_ptr<TagFile> study(int count) const;

private:
    QTemporaryDir mFolder;
    std::vector<std::string> mFiles;
    qint64 mHeaderBytes = 0;
};

/// 1,000 images, made when first asked for.
const Workload& thousandImages();

}  // namespace Kdd
