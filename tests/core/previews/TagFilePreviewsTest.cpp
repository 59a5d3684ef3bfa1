#include "core/tagfile/TagFileFixture.h"
#include "kddlib/previews/PreviewGenerator.h"
#include "kddlib/volumes/Volume.h"

#include <QImage>

#include <gmock/gmock.h>

namespace
{

using namespace Kdd;

class VolumeOfImages : public Volume
{
public:
    VolumeOfImages(const QVector<TagMap*>& images, int slices, const QByteArray& preview)
    {
        setImages(images, nullptr);
        setMultiFrameInfo({});
        setGeometry({1, 1, slices}, {}, {});
        setPreviewData(preview);
    }
};

class TagFilePreviews : public TagFileTest
{
protected:
    /// An image with pixel data that is too long to be kept.
    TagMap* shot(const QByteArray& uid, int number, const DatasetBuilder& base,
                 const QByteArray& preview = {})
    {
        std::unique_ptr<TagMap> map(base.map());
        map->putAndInsertString(DCM_SOPInstanceUID, uid);
        map->putAndInsertInt(DCM_InstanceNumber, number);
        map->markAsOmitted(DCM_PixelData);
        TagMap* image = file.addTagMap(map.release(), nullptr, true);
        if (!preview.isEmpty())
            image->putAndInsertValue(kPreview, VrCode::OB, preview);
        return image;
    }

    /// `count` images, numbered downwards: the image "ct.5" has number -5.
    void shots(const char* name, int count, const DatasetBuilder& base)
    {
        for (int i = 0; i < count; ++i)
            shot(name + ('.' + QByteArray::number(i)), -i, base);
    }

    std::string selected() const
    {
        QList<QByteArray> uids{"left over"};
        file.selectPreviewImages2D(uids);
        return uids.join(' ').toStdString();
    }

    TagFile file;
};

DatasetBuilder aSlice(const char* series = "1.2.3")
{
    return anImage().inSeries(series).with(DCM_SOPClassUID, UID_CTImageStorage);
}

TEST_F(TagFilePreviews, AllImagesOfAShortSeriesAreSelectedAndTheMiddleOfALongOne)
{
    shots("short", 19, aSlice("1"));
    shots("long", 20, aSlice("2"));
    shots("capture", 3, anImage().inSeries("3"));
    shots("ct", 40, aSlice("3"));
    // The 11th smallest of the numbers -19 to 0 is -9.
    EXPECT_THAT(selected(), testing::MatchesRegex("(short.[0-9]+ ){19}long.9 capture.1 ct.19"));
}

TEST_F(TagFilePreviews, EachSpecialKindIsRepresentedByOneImage)
{
    shots("loc", 4, aSlice().with(DCM_ImageType, "ORIGINAL\\PRIMARY\\LOCALIZER"));
    shots("us", 2, anImage().with(DCM_SOPClassUID, UID_UltrasoundImageStorage));
    shots("multi", 2, aSlice().with(DCM_NumberOfFrames, "2"));
    shots("one", 1, aSlice().with(DCM_NumberOfFrames, "1"));
    shot("shown", 1, aSlice())->putAndInsertInt({0x0006, 0x7103}, 0);
    shot("no pixels", 1, aSlice())->markAsMissing(DCM_PixelData);
    TagMap* floats = shot("float", 1, aSlice());
    floats->markAsMissing(DCM_PixelData);
    floats->markAsOmitted(DCM_FloatPixelData);
    shots("ct", 3, aSlice("8").with(DCM_Modality, "CT").with(DCM_SeriesDescription, "scout view"));
    shots("mr", 3, aSlice("9").with(DCM_Modality, "MR").with(DCM_SeriesDescription, "scout view"));
    EXPECT_EQ(selected(), "multi.0 multi.1 us.0 loc.1 one.0 float ct.0 ct.1 ct.2 mr.1");
}

TEST_F(TagFilePreviews, AStudyIsRepresentedByItsLargestVolumeAndElseByItsFirstSeries)
{
    TagMap* late = shot("late", 1, aSlice("1").with(DCM_SeriesNumber, "10"), "late")->parent();
    TagMap* early = shot("early", 1, aSlice("2").with(DCM_SeriesNumber, "9"));
    TagMap* owner = late;
    EXPECT_EQ(early->parent()->findPreviewData(&owner), "");
    EXPECT_EQ(owner, nullptr);
    EXPECT_EQ(file.study()->findPreviewData(&owner), "late");
    early->putAndInsertValue(kPreview, VrCode::OB, "early");
    EXPECT_EQ(file.study()->findPreviewData(&owner), "early");
    EXPECT_EQ(owner, early);

    QVector<TagMap*> images;
    for (int i = 0; i < 240; ++i)
        images.append(shot("s" + QByteArray::number(i), i, aSlice("1")));
    late->addBareVolume(new VolumeOfImages(images.mid(0, 100), 100, "100"));
    late->addBareVolume(new VolumeOfImages(images, 240, "240"));
    late->addBareVolume(new VolumeOfImages(images, 300, ""));
    EXPECT_EQ(file.study()->findPreviewData(&owner), "240");
    EXPECT_EQ(owner, file.findImage("s120"));
    EXPECT_EQ(images.first()->findPreviewData(nullptr), "");
    late->putAndInsertValue(kPreview, VrCode::OB, "shared");
    EXPECT_EQ(images.first()->findPreviewData(&owner), "shared");
    EXPECT_EQ(owner, images.first());
}

TEST_F(TagFilePreviews, ExportedFilesNeverOverwriteEachOther)
{
    const auto jpeg = [](int width) {
        QImage image(width, 8, QImage::Format_Grayscale8);
        image.fill(0);
        return PreviewGenerator::createPreviewData(image);
    };
    for (const int width : {10, 11, 12})
        shot(QByteArray::number(width), 7, aSlice("1").with(DCM_SeriesNumber, "3"), jpeg(width));
    shot("d", 7, aSlice("2").with(DCM_SeriesNumber, "3"), jpeg(13));
    TagMap* damaged = shot("e", 8, aSlice("2"), "no JPEG");
    damaged->parent()->addBareVolume(new VolumeOfImages({}, 1, ""));
    damaged->parent()->addBareVolume(new VolumeOfImages({}, 1, jpeg(14)));

    const LogCapture log;
    EXPECT_EQ(file.exportPreviews(mStore.folder()), 5);
    const char* const names[] = {"add9573d_Series_3_Image_7.jpg", "add9573d_Series_3_Image_7_2.jpg",
                                 "add9573d_Series_3_Image_7_3.jpg", "add9573d_Series_3_2_Image_7.jpg",
                                 "add9573d_Series_3_2_Volume_2.jpg"};
    for (int i = 0; i < 5; ++i)
        EXPECT_EQ(QImage(mStore.filePath(names[i])).width(), 10 + i) << names[i];
    const std::string folder = mStore.folder().toStdString() + '/';
    EXPECT_EQ(log.count("Error exporting preview " + folder + "add9573d_Series_3_2_Image_8.jpg"), 1);
    EXPECT_EQ(log.count("5 preview image(s) written to " + folder), 1);
}

TEST_F(TagFilePreviews, AnImageKeepsItsPreviewAndElseTheReasonIsLogged)
{
    std::vector<Uint8> pixels(64 * 64);
    for (std::size_t i = 0; i < pixels.size(); ++i)
        pixels[i] = static_cast<Uint8>(i * i);
    const DatasetBuilder image = anImage("1.7").asPicture(64, 64, 8).bytes(pixels);
    const QString path = mStore.filePath("image");
    image.save(path);
    add(file, image);
    add(file, anImage("1.8"));

    EXPECT_TRUE(file.addPreview("1.7", path));
    const QByteArray preview = file.findImage("1.7")->findPreviewData(nullptr);
    EXPECT_GT(preview.size(), 1024);  // more than other values may have
    EXPECT_EQ(QImage::fromData(preview, "JPEG").size(), QSize(64, 64));
    EXPECT_FALSE(file.addPreview("1.9", path));

    const LogCapture log;
    EXPECT_FALSE(file.addPreview("1.7", QStringLiteral("/absent")));
    EXPECT_FALSE(file.addPreview(&anImage("1.8").dataset(), QStringLiteral("/pixels")));
    const std::string message = "Could not create preview image for DICOM file: ";
    EXPECT_EQ(log.count(message + "/absent (No such file or directory)"), 1);
    EXPECT_EQ(log.count(message + "/pixels (There are no pixel data)"), 1);
}

}  // namespace
