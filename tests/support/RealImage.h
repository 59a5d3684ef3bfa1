#pragma once

#include "kddlib/items/FrameIndex.h"
#include "kddlib/items/RegularFile.h"
#include "kddlib/net/dicom/DicomFileReader.h"
#include "support/ByteSource.h"
#include "support/RealFiles.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctk.h>
#include <gtest/gtest.h>

namespace Kdd
{

/// An image file's bytes in usual form, as it is or converted, and what our reader and DCMTK make of them.
struct RealImage
{
    explicit RealImage(const QString& path)
        : source(ByteSource::ofFile(path))
    {
        QByteArray converted;
        if (index.read(source).bad() && readAsRegularFile(path.toLocal8Bit(), converted).good())
            source = ByteSource(converted);
        isUsable = index.read(source).good() && readDicomBuffer(source.bytes(), file).good();
    }

    ByteSource source;
    FrameIndex index;
    DcmFileFormat file;
    bool isUsable = false;
};

/// Tests of the images that can be read among the real files.
class RealImages : public testing::Test
{
protected:
    void SetUp() override
    {
        if (realFilesFolder().isEmpty())
            GTEST_SKIP() << "KDD_TEST_DATA is not set";
    }

    /// Calls `test(path, image)` for each that lies in the folders.
    template <typename Test>
    static void forEach(std::initializer_list<const char*> folders, const Test& test)
    {
        for (const char* folder : folders) {
            for (const QString& path : realFiles(folder)) {
                SCOPED_TRACE(path.toStdString());
                RealImage image(path);
                if (image.isUsable)
                    test(path, image);
            }
        }
    }
};

}  // namespace Kdd
