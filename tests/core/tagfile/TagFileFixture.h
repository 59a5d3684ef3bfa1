#pragma once

#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/Volume.h"
#include "kddlib/volumes/VolumeInfo.h"
#include "support/DatasetBuilder.h"
#include "support/FileContent.h"
#include "support/LogCapture.h"
#include "support/TemporaryStore.h"
#include "support/TreeText.h"

#include <QDataStream>

#include <gtest/gtest.h>

#include <memory>

namespace Kdd
{

using Mode = TagFile::CompressionMode;
using Uids = QList<QByteArray>;

constexpr Mode kModes[] = {Mode::None, Mode::Zlib, Mode::Lzma};
constexpr int kHeaderSize = 12;  // of a file, with the size of its body

/// A store of its own and the words in which tests speak of tag files.
class TagFileTest : public testing::Test
{
public:
    static TagMap* add(TagFile& file, const DatasetBuilder& image, const char* path = nullptr)
    {
        return file.addTagMap(image.map(), path, true);
    }

protected:
    /// What an image shows that is no part of a tree.
    static std::string shownAlone(const DatasetBuilder& image)
    {
        return shownText(*std::unique_ptr<TagMap>(image.map()));
    }

    /// The content of a tag file.
    static QByteArray written(TagFile& file, Mode mode = Mode::None)
    {
        TagFile::setCompressionMode(mode);
        QByteArray content;
        QDataStream out(&content, QIODevice::WriteOnly);
        EXPECT_TRUE(file.writeCacheFile(out));
        TagFile::setCompressionMode(Mode::Zlib);
        return content;
    }

    /// The same around any body, as it is stored.
    static QByteArray framed(const QByteArray& stored, Mode mode = Mode::None)
    {
        QByteArray content("TaCa\0\0\2", 7);
        QDataStream out(&content, QIODevice::WriteOnly | QIODevice::Append);
        out << static_cast<quint8>(mode) << stored
            << qint32(0);  // a byte array and a body have the same form
        return content;
    }

    static int bodySize(const QByteArray& content)
    {
        return content.mid(kHeaderSize - 4, 4).toHex().toInt(nullptr, 16);
    }

    static bool read(TagFile& file, const QByteArray& content, const char* studyUID = nullptr)
    {
        QDataStream in(content);
        return file.readCacheFile(in, studyUID);
    }

    /// What the file of a volume says, one slice for each image. The name tells volumes and their previews apart.
    static VolumeInfo aVolume(const std::vector<std::string>& imageUIDs, const char* name)
    {
        VolumeInfo info;
        info.imageUIDs = imageUIDs;
        info.name = info.preview = name;
        info.dims = {4, 4, static_cast<int>(imageUIDs.size())};
        info.histogram = KxHistogram({3, 4}, 0, 100);
        return info;
    }

    static void addVolumes(TagFile& file, std::vector<VolumeInfo> infos)
    {
        std::vector<VolumeInfo*> pointers;
        for (VolumeInfo& each : infos)
            pointers.push_back(&each);
        file.addVolumeInfo(pointers);
    }

    /// A study with something of everything that a record can hold.
    static void fill(TagFile& file)
    {
        for (const char* uid : {"1", "2", "3"}) {
            const DatasetBuilder item = anItem().with(DCM_CodeValue, uid);
            DatasetBuilder image = anImage(uid).with(DCM_PatientName, "Doe^J").with(DCM_Rows, "512");
            image.inSeries(*uid == '3' ? "1.2.4" : "1.2.3");
            image.withItem(DCM_RequestAttributesSequence, anItem().withItem(DCM_ReferencedSOPSequence, item));
            if (*uid != '2')
                image.withLong(DCM_TextValue, 2000).with(DCM_PatientComments, "not in all");
            add(file, image)->putAndInsertValue(kPreview, VrCode::OB, QByteArray(uid) + "jpeg");
        }
        auto* volume = new Volume;
        volume->setPreviewData("the volume's jpeg");
        file.findSeries("1.2.3")->addBareVolume(volume);
        file.optimizeAll();
    }

    /// The file of the study that images belong to by default.
    static QString path() { return TagFile::cacheFilePathForStudy("1.2"); }
    static QString journal() { return path() + QStringLiteral(".journal"); }
    static std::string named(const char* message) { return message + path().toStdString(); }

    static void put(const QString& name, const QByteArray& content) { putFile(name, content); }
    static QByteArray content(const QString& name = path()) { return fileContent(name); }

    TemporaryStore mStore;
};

}  // namespace Kdd
