#include "server/browser/StudyJson.h"

#include "BrowserFixture.h"
#include "server/browser/AttributeTree.h"
#include "server/browser/Difference.h"
#include "server/browser/ShownValue.h"

#include <kddlib/OwnAttributes.h>
#include <kddlib/QAData.h>
#include <kddlib/StudyRecord.h>
#include <kddlib/VolumeInfo.h>

using namespace Kdd;
using namespace Kdd::Browser;

namespace
{

DatasetBuilder image(const char* uid, const char* series, const QByteArray& number)
{
    return anImage(uid).inSeries(series).with("PatientName=Doe^Jane|InstanceNumber=" + number);
}

/// Two series; only the last image lacks the description, and has another item than the others.
QVector<DatasetBuilder> study()
{
    const auto item = [](const char* uid) {
        return anItem().with(DCM_ReferencedSOPClassUID, "1.2.840").with(DCM_ReferencedSOPInstanceUID, uid);
    };
    const auto full = [&](const char* uid, const char* series, const char* number) {
        return image(uid, series, number)
            .with(DCM_StudyDescription, "A description long enough to be shared")
            .with(DCM_SeriesDescription, series)
            .withItem(DCM_ReferencedImageSequence, item("1.7"));
    };
    return {full("1.4.1", "1.3.1", "10"),
            full("1.4.2", "1.3.1", "9"),
            full("1.4.3", "1.3.2", "1"),
            full("1.4.4", "1.3.2", "2"),
            full("1.4.6", "1.3.2", "3"),
            image("1.4.5", "1.3.2", "")
                .with(DCM_SeriesDescription, "1.3.2")
                .withItem(DCM_ReferencedImageSequence, item("1.8"))};
}

const std::tuple<const char*, const char*, const char*> kOrigins[] = {
    {"1.4.1", "00100010", "study"},
    {"1.4.4", "0008103E", "series"},
    {"1.4.2", "00200013", "image"},
    {"1.4.1", "00081030", "study"},
    {"1.4.5", "00081030", "image hidden"},
    {"1.4.1", "00080018", "image"},
    {"1.4.1", "00104000", ""},
    {"1.4.1", "00067100", ""},
};

}  // namespace

TEST_F(BrowserTest, TellsWhichNodeHoldsEachValue)
{
    write(study());
    for (const auto& [uid, tag, origin] : kOrigins) {
        const QJsonValue held = attribute(uid, tag);
        EXPECT_EQ(textAt(held, "origin") + (jsonAt(held, "hidden").toBool() ? " hidden" : ""), origin)
            << uid << ' ' << tag;
    }
}

TEST_F(BrowserTest, ShowsOfImagesThatDifferWhatSearchesShow)
{
    TagFile file;
    // Of two names the longer one is cheaper to store at the study, and it came first.
    const auto put = [&](const char* uid, const char* name, const char* path) {
        TagMap* added = image(uid, "1.3.1", "1").with(DCM_PatientName, name).map();
        ASSERT_EQ(file.addTagMap(added, path, true), added);
        added->putAndInsertValue(kFilePath, VrCode::LO, path);
    };
    put("1.4.1", "Doe^Jane Elizabeth", "/d/b");
    put("1.4.2", "Doe^J", "/d/a");
    file.optimizeAll();
    ASSERT_TRUE(file.writeCacheFile());
    EXPECT_EQ(text("", "attributes/PatientName"), builtStudy(file).search.patientName.toStdString());
    EXPECT_EQ(text("", "attributes/PatientName"), "Doe^J");
}

TEST_F(BrowserTest, TellsWhichNodesItemHoldsAValueInside)
{
    write(study());
    const auto inside = [this](const char* uid, const char* tag) {
        EXPECT_EQ(jsonAt(attribute(uid, "00081140"), "count"), 1);
        const QJsonValue one = entry(jsonAt(attribute(uid, "00081140"), "items/0"), tag);
        return textAt(one, "value") + ' ' + textAt(one, "origin");
    };
    EXPECT_EQ(inside("1.4.5", "00081155"), "1.8 image");
    EXPECT_EQ(inside("1.4.5", "00081150").substr(0, 8), "1.2.840 ");
    EXPECT_EQ(inside("1.4.1", "00081155").substr(0, 4), "1.7 ");
    EXPECT_NE(inside("1.4.1", "00081155"), "1.7 image");
}

TEST_F(BrowserTest, ListsImagesByNumberInPieces)
{
    write(study());
    const QJsonValue list = told("/series/1.3.2/images?offset=1&limit=2", "");
    EXPECT_EQ(jsonAt(list, "count"), 4);
    ASSERT_EQ(jsonAt(list, "images").toArray().size(), 2);
    EXPECT_EQ(textAt(list, "images/0/key"), "1.4.4");
    for (const char* odd : {"offset=-1", "offset=99", "offset=2147483647", "limit=x"})
        EXPECT_LE(told(QByteArray("/series/1.3.2/images?") + odd, "images").toArray().size(), 4);
    EXPECT_TRUE(told("/images/1.4.2/attributes", "previous").isNull());
    EXPECT_EQ(text("/images/1.4.2/attributes", "next"), "1.4.1");
}

TEST_F(BrowserTest, CutsWhatIsTooMuchAndSaysSo)
{
    DatasetBuilder item = anItem();
    for (unsigned short i = 0; i < 25; ++i)
        item.with(DcmTag(0x0018, static_cast<unsigned short>(0x9000 + i), EVR_LO), "value");
    DatasetBuilder image = anImage("1.4");
    for (int i = 0; i < kMaxShownItems + 3; ++i)
        image.withItem(DCM_ReferencedImageSequence, item);
    image.withLong(DCM_TextValue, kMaxValueLength + 500);
    TagFile file;
    file.addTagMap(image.map(1 << 20), nullptr, true);
    ASSERT_TRUE(file.writeCacheFile());

    EXPECT_EQ(told("/images/1.4/attributes", "complete"), false);
    const QJsonValue sequence = attribute("1.4", "00081140");
    EXPECT_EQ(jsonAt(sequence, "count"), kMaxShownItems + 3);
    EXPECT_LE(jsonAt(sequence, "items").toArray().size(), kMaxTreeEntries / 25);
    // It comes after the sequence, and is there all the same.
    const QJsonValue value = attribute("1.4", "0040A160");
    EXPECT_EQ(jsonAt(value, "value").toString().size(), kMaxValueLength);
    EXPECT_EQ(jsonAt(value, "length"), kMaxValueLength + 500);
}

TEST_F(BrowserTest, GivesNoMoreAtOnceThanPeopleLookAt)
{
    DatasetBuilder full = anImage("1.4");
    for (unsigned short i = 0; i < kMaxDifferences + 1; ++i)
        full.with(
            DcmTag(i < 0x1000 ? 0x0018 : 0x0020, static_cast<unsigned short>(0x8000 + i % 0x1000), EVR_LO),
            "value");
    TagFile file;
    file.addTagMap(full.map(), nullptr, true);
    // In a series of their own: what many images of one have to tell apart takes its time.
    for (int i = 0; i <= kMaxListedImages; ++i)
        file.addTagMap(anImage(("1.5." + std::to_string(i)).c_str()).inSeries("1.6").map(), nullptr, true);
    ASSERT_TRUE(file.writeCacheFile());
    const QJsonValue listed = told("/series/1.6/images?limit=5000", "");
    EXPECT_EQ(jsonAt(listed, "images").toArray().size(), kMaxListedImages);
    EXPECT_EQ(jsonAt(listed, "count"), kMaxListedImages + 1);
    const QJsonValue found = told("/difference?a=1.4&b=1.5.1", "");
    EXPECT_EQ(jsonAt(found, "differences").toArray().size(), kMaxDifferences);
    EXPECT_EQ(jsonAt(found, "complete"), false);
}

TEST_F(BrowserTest, DecodesTextsByTheCharacterSetOfTheirImage)
{
    write({anImage("1.4").with("SpecificCharacterSet=ISO_IR 100|PatientName=M\xfcller")});
    EXPECT_EQ(text("", "attributes/PatientName"), "Müller");
}

TEST_F(BrowserTest, TellsInWhatImagesDiffer)
{
    write(study());
    const QJsonValue list = told("/difference?a=1.4.4&b=1.4.5", "differences");
    EXPECT_EQ(list.toArray().size(), 4);  // own UID, number, description, the item's UID
    EXPECT_TRUE(jsonAt(entry(list, "00081030"), "b").isNull());
    EXPECT_EQ(textAt(entry(list, "00081155"), "path"), "(0008,1140)[0].");
    EXPECT_EQ(textAt(entry(list, "00081155"), "b/value"), "1.8");
    EXPECT_EQ(told("/difference?a=1.4.4&b=1.4.4", "differences"), QJsonArray());
}

TEST_F(BrowserTest, TellsACorrectionOnceForAllItsImages)
{
    write(study());
    QAData job;
    job.studyUID = "1.2";
    job.images = {"1.4.1", "1.4.3"};
    job.timestamp = "20240131120000";
    job.login = "anna";
    job.substitutions = {{DCM_PatientName, QStringLiteral("<b>New")}};
    QString message;
    ASSERT_TRUE(TagFile::applyQA(job, message)) << qPrintable(message);
    ASSERT_EQ(told("/corrections", "corrections").toArray().size(), 1);
    const QJsonValue correction = told("/corrections", "corrections/0");
    EXPECT_EQ(jsonAt(correction, "count"), 2);
    EXPECT_TRUE(jsonAt(correction, "time").toString().endsWith(QStringLiteral("anna")));
    const QJsonValue change = entry(jsonAt(correction, "changes"), "00100010");
    EXPECT_EQ(textAt(change, "old"), "Doe^Jane");
    EXPECT_EQ(textAt(change, "new"), "<b>New");
    EXPECT_EQ(told("", "corrected"), true);
}

TEST_F(BrowserTest, TellsAVolumesGeometryInMillimetres)
{
    TagFile file;
    for (const DatasetBuilder& one : study())
        file.addTagMap(one.map(), nullptr, true);
    VolumeInfo info;
    info.imageUIDs = {"1.4.1", "1.4.2"};
    info.name = "volume-a.h5";
    info.dims = {512, 256, 2};
    info.transformation = {{0, 0, 2, -10, 0.5F, 0, 0, -20, 0, -0.25F, 0, 30, 0, 0, 0, 1}};  // sagittal
    info.rescaleIntercept = -1024;
    info.preview = "\xff\xd8picture";
    file.addVolumeInfo({&info});
    ASSERT_TRUE(file.writeCacheFile());
    const QJsonValue volume = told("", "series/0/volumes/0");
    EXPECT_EQ(jsonAt(volume, "dims"), (QJsonArray{512, 256, 2}));
    EXPECT_EQ(jsonAt(volume, "spacing"), (QJsonArray{0.5, 0.25, 2}));
    EXPECT_EQ(jsonAt(volume, "origin"), (QJsonArray{-10, -20, 30}));
    EXPECT_EQ(jsonAt(volume, "plane"), QLatin1String("sagittal"));
    EXPECT_EQ(jsonAt(volume, "intercept"), -1024);
    for (const char* target :
         {"/browser/studies/1.2/series/1.3.1/volumes/0/preview", "/browser/studies/1.2/preview"})
        EXPECT_EQ(bodyOf(get(target)), info.preview) << target;
}
