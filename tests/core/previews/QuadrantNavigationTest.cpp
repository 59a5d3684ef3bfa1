#include "kddlib/previews/QuadrantNavigation.h"

#include "kddlib/net/dicom/DicomFileReader.h"
#include "kddlib/previews/PreviewGenerator.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/volumefile/ParamBundle.h"
#include "support/DatasetBuilder.h"
#include "support/RealFiles.h"

#include <QFile>
#include <QImage>
#include <QRegion>
#include <QTransform>

#include <gtest/gtest.h>

#include <memory>
#include <tuple>

namespace
{

using namespace Kdd;
using Side = QuadrantNavigation::Side;

/// A left breast of 120 x 180 pixels at the left side of 192 x 256, on noise.
QImage aBreast(const QRegion& white = {}, int muscleWidth = 0, QRgb inversion = 0)
{
    const auto inEllipse = [](double x, double y) { return x * x + y * y <= 1; };
    QImage picture(192, 256, QImage::Format_RGB32);
    for (int y = 0; y < 256; ++y) {
        for (int x = 0; x < 192; ++x) {
            int level = 2 + x * x * y % 7;
            if (inEllipse((x + 0.5) / 120, (y - 127.5) / 90))
                level = inEllipse((x - 50) / 40.0, (y - 127.5) / 50) ? 220 : 70;
            if (x < muscleWidth - y / 2)
                level = 180;
            if (white.contains(QPoint(x, y)))
                level = 255;
            picture.setPixel(x, y, qRgb(level, level, level) ^ inversion);
        }
    }
    return picture;
}

QVector<float> found(const QImage& picture)
{
    return QuadrantNavigation::computeImageBoxAndCenter(picture, {});
}

const QRegion kLabel(160, 100, 32, 12);   // by itself
const QRegion kTouching(70, 60, 100, 5);  // a stroke from the breast outwards
const QRegion kFrame = QRegion(0, 0, 192, 256) - QRegion(0, 5, 186, 246);

// In pixels of a picture of 192 x 256; then the side of the chest wall.
const QVector<float> kLeft{0, 38, 120, 218, 51, 128, 120, 128, 1};
const QVector<float> kRight{72, 38, 192, 218, 141, 128, 72, 128, 2};
const QVector<float> kOblique{0, 0, 120, 218, 49, 112, 120, 128, 1};
const QVector<float> kTurned{28.5F, 0, 163.5F, 160, 96, 68, 96, 160, 3};  // of 256 x 192

const std::tuple<const char*, QImage, QVector<float>> kDrawn[] = {
    {"Left", aBreast(), kLeft},
    {"Right", aBreast().mirrored(true, false), kRight},
    {"Turned", aBreast().transformed(QTransform().rotate(90)), kTurned},
    {"Oblique", aBreast({}, 80), kOblique},
    {"Labelled", aBreast(kLabel), kLeft},
    {"LabelTouches", aBreast(kTouching), kLeft},
    {"Framed", aBreast(kFrame), kLeft},
    {"Inverted", aBreast(kLabel, 80, 0xffffff), kOblique},
    {"Enlarged", aBreast(kLabel).scaled(768, 1024), kLeft},
};

TEST(QuadrantNavigation, FindsTheBreastWithinAPixel)
{
    for (const auto& [name, picture, drawn] : kDrawn) {
        const QVector<float> values = found(picture);
        ASSERT_EQ(values.size(), QuadrantNavigation::kNumValues) << name;
        for (int i = 0; i < 8; ++i)
            EXPECT_NEAR(values[i] * (i % 2 == 0 ? 192.F : 256.F), drawn[i], 1) << name << ' ' << i;
        EXPECT_EQ(values[8], drawn[8]) << name;
    }
}

TEST(QuadrantNavigation, FindsNothingWhereThereIsNoBreast)
{
    QImage picture(192, 256, QImage::Format_RGB32);
    for (int i = 0; i < 192 * 256; ++i)
        picture.setPixel(i % 192, i / 192, qRgb(100 + i % 192 / 20, 100, 100));  // uneven light
    EXPECT_EQ(found(picture), QVector<float>());
    picture.fill(Qt::black);
    EXPECT_EQ(found(picture), QVector<float>());
    for (int i = 0; i < 500; ++i)
        picture.setPixel(100 + i % 25, 100 + i / 25, qRgb(255, 255, 255));
    EXPECT_EQ(found(picture), QVector<float>());
    EXPECT_EQ(found(QImage()), QVector<float>());
}

struct Said
{
    const char* laterality;
    const char* view;
    const char* patientOrientation;
    Side chestWall;
    Side upper;
};

const Said kSaid[] = {
    {"L", "CC", "A\\R", Side::Left, Side::Top},        {"R", "CC", "P\\L", Side::Right, Side::Top},
    {"L", "CC", "R\\P", Side::Bottom, Side::Left},     {"R", "XCCL", "P\\R", Side::Right, Side::Bottom},
    {"R", "MLO", "P\\FL", Side::Right, Side::Top},     {"L", "ML", "A\\H", Side::Left, Side::Bottom},
    {"L", "other", "A\\R", Side::Left, Side::Unknown}, {"B", "CC", "A\\R", Side::Left, Side::Unknown},
    {"L", "MLO", "", Side::Unknown, Side::Unknown},
};

DatasetBuilder aMammogram(const Said& said)
{
    DatasetBuilder image = anImage().with(DCM_Modality, "MG").with(DCM_ImageLaterality, said.laterality);
    return image.with(DCM_ViewPosition, said.view).with(DCM_PatientOrientation, said.patientOrientation);
}

TEST(QuadrantNavigation, ImagesAndVolumeFilesTellTheOrientation)
{
    for (const Said& said : kSaid) {
        const std::unique_ptr<TagMap> image(aMammogram(said).map());
        ParamBundle dicom;
        dicom.insert("G0020-0060", Parameter::ofText(QByteArray("CS:") + said.laterality));
        dicom.insert("G0018-5101", Parameter::ofText(QByteArray("CS:") + said.view));
        dicom.insert("G0020-0020", Parameter::ofText(QByteArray("CS:") + said.patientOrientation));
        const auto ofImage = QuadrantNavigation::checkOrientation(*image);
        const auto ofVolume = QuadrantNavigation::checkOrientation(dicom);
        EXPECT_EQ(ofImage.chestWall, said.chestWall) << said.patientOrientation;
        EXPECT_EQ(ofVolume.chestWall, said.chestWall) << said.patientOrientation;
        EXPECT_EQ(ofImage.upper, said.upper) << said.view << said.patientOrientation;
        EXPECT_EQ(ofVolume.upper, said.upper) << said.view << said.patientOrientation;
        EXPECT_EQ(QuadrantNavigation::isSupported(*image), said.laterality[0] != 'B');
    }
}

TEST(QuadrantNavigation, ATomosynthesisIsKnownByItsCodesAndReceivesTheValues)
{
    const auto groups = anItem().withItem(DCM_FrameAnatomySequence, anItem().with(DCM_FrameLaterality, "R"));
    DatasetBuilder dataset = anImage().with(DCM_SOPClassUID, UID_BreastTomosynthesisImageStorage);
    dataset.withItem(DCM_ViewCodeSequence, anItem().with(DCM_CodeValue, "R-10242"));
    dataset.withItem(DCM_SharedFunctionalGroupsSequence, groups).with(DCM_PatientOrientation, "P\\L");
    const std::unique_ptr<TagMap> image(dataset.map());
    EXPECT_TRUE(QuadrantNavigation::process(aBreast(), *image));
    QByteArray text;
    EXPECT_TRUE(image->findAndGetString({0x0071, 0x0070}, "Korvex", text));
    EXPECT_TRUE(text.startsWith("0\\0.148438\\0.625\\") && text.endsWith("\\2\\3")) << text.constData();
    EXPECT_EQ(image->findElement(DcmTagKey(0x0071, 0x1070))->vr(), VrCode::FL);
    image->putAndInsertString(DCM_SOPClassUID, UID_CTImageStorage);
    EXPECT_FALSE(QuadrantNavigation::process(aBreast(), *image));
}

TEST(QuadrantNavigation, FindsTheChestWallOfRealMammogramsWhereTheySayItIs)
{
    if (realFilesFolder().isEmpty())
        GTEST_SKIP() << "KDD_TEST_DATA is not set";
    for (const QString& path : realFiles("modalities/mg")) {
        DcmFileFormat file;
        ASSERT_TRUE(readDicomFile(QFile::encodeName(path).constData(), file).good());
        const QImage preview = PreviewGenerator::createPreviewImage(file.getDataset(), 256, 256, path);
        const std::unique_ptr<TagMap> image(TagMap::createTagMap(file.getDataset(), 1024));
        const auto orientation = QuadrantNavigation::checkOrientation(*image);
        EXPECT_EQ(found(preview).value(8), float(orientation.chestWall)) << path.toStdString();
    }
}

}  // namespace
