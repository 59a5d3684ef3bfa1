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

QString attributesOf(const QString& tag, const QJsonObject& tree)
{
    for (const QJsonValue& one : tree[QStringLiteral("attributes")].toArray())
        if (one[QStringLiteral("tag")] == tag)
            return one[QStringLiteral("origin")].toString() +
                   QLatin1String(one[QStringLiteral("hidden")].toBool() ? " hidden" : "");
    return QStringLiteral("none");
}

DatasetBuilder image(const char* uid, const char* series, const char* number)
{
    return anImage(uid)
        .inStudy("1.2")
        .inSeries(series)
        .with(DCM_InstanceNumber, number)
        .with(DCM_PatientName, "Doe^Jane");
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

struct Origin
{
    const char* image;
    const char* tag;
    const char* origin;
};

const Origin kOrigins[] = {
    {"1.4.1", "00100010", "study"}, {"1.4.4", "0008103E", "series"},       {"1.4.2", "00200013", "image"},
    {"1.4.1", "00081030", "study"}, {"1.4.5", "00081030", "image hidden"}, {"1.4.1", "00080018", "image"},
    {"1.4.1", "00104000", "none"},  {"1.4.1", "00067100", "none"},
};

}  // namespace

TEST_F(BrowserTest, TellsWhichNodeHoldsEachValue)
{
    write(study());
    for (const Origin& one : kOrigins) {
        const QJsonObject tree = json(QByteArray("/browser/studies/1.2/images/") + one.image + "/attributes");
        EXPECT_EQ(attributesOf(QLatin1String(one.tag), tree).toStdString(), one.origin)
            << one.image << ' ' << one.tag;
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
    const QJsonObject attributes = json("/browser/studies/1.2")[QStringLiteral("attributes")].toObject();
    EXPECT_EQ(text(attributes, "PatientName"), builtStudy(file).search.patientName.toStdString());
    EXPECT_EQ(text(attributes, "PatientName"), "Doe^J");
}

TEST_F(BrowserTest, TellsWhichNodesItemHoldsAValueInside)
{
    write(study());
    const auto item = [this](const char* uid) {
        const QJsonObject tree = json(QByteArray("/browser/studies/1.2/images/") + uid + "/attributes");
        const QJsonObject sequence = entry(tree[QStringLiteral("attributes")], "00081140");
        EXPECT_EQ(sequence[QStringLiteral("count")].toInt(), 1);
        return sequence[QStringLiteral("items")][0];
    };
    EXPECT_EQ(text(entry(item("1.4.5"), "00081155"), "value"), "1.8");
    EXPECT_EQ(text(entry(item("1.4.5"), "00081155"), "origin"), "image");
    EXPECT_EQ(text(entry(item("1.4.5"), "00081150"), "value"), "1.2.840");
    EXPECT_EQ(text(entry(item("1.4.1"), "00081155"), "value"), "1.7");
    EXPECT_NE(text(entry(item("1.4.1"), "00081155"), "origin"), "image");
}

TEST_F(BrowserTest, ListsImagesByNumberInPieces)
{
    write(study());
    const QJsonObject list = json("/browser/studies/1.2/series/1.3.2/images?offset=1&limit=2");
    EXPECT_EQ(list[QStringLiteral("count")].toInt(), 4);
    ASSERT_EQ(list[QStringLiteral("images")].toArray().size(), 2);
    EXPECT_EQ(list[QStringLiteral("images")][0][QStringLiteral("key")].toString(), QStringLiteral("1.4.4"));
    for (const char* odd : {"offset=-1", "offset=99", "offset=2147483647", "limit=x"})
        EXPECT_LE(
            json(QByteArray("/browser/studies/1.2/series/1.3.2/images?") + odd)[QStringLiteral("images")]
                .toArray()
                .size(),
            4);
    const QJsonObject first = json("/browser/studies/1.2/images/1.4.2/attributes");
    EXPECT_TRUE(first[QStringLiteral("previous")].isNull());
    EXPECT_EQ(text(first, "next"), "1.4.1");
}

TEST_F(BrowserTest, CutsWhatIsTooMuchAndSaysSo)
{
    DatasetBuilder item = anItem();
    for (unsigned short i = 0; i < 25; ++i)
        item.with(DcmTag(0x0018, static_cast<unsigned short>(0x9000 + i), EVR_LO), "value");
    DatasetBuilder image = anImage("1.4").inStudy("1.2").inSeries("1.3");
    for (int i = 0; i < kMaxShownItems + 3; ++i)
        image.withItem(DCM_ReferencedImageSequence, item);
    image.withLong(DCM_TextValue, kMaxValueLength + 500);
    TagFile file;
    file.addTagMap(image.map(1 << 20), nullptr, true);
    ASSERT_TRUE(file.writeCacheFile());

    const QJsonObject tree = json("/browser/studies/1.2/images/1.4/attributes");
    EXPECT_FALSE(tree[QStringLiteral("complete")].toBool());
    const QJsonObject sequence = entry(tree[QStringLiteral("attributes")], "00081140");
    EXPECT_EQ(sequence[QStringLiteral("count")].toInt(), kMaxShownItems + 3);
    EXPECT_LE(sequence[QStringLiteral("items")].toArray().size(), kMaxTreeEntries / 25);
    // It comes after the sequence, and is there all the same.
    const QJsonObject value = entry(tree[QStringLiteral("attributes")], "0040A160");
    EXPECT_EQ(value[QStringLiteral("value")].toString().size(), kMaxValueLength);
    EXPECT_EQ(value[QStringLiteral("length")].toInt(), kMaxValueLength + 500);
}

TEST_F(BrowserTest, GivesNoMoreAtOnceThanPeopleLookAt)
{
    DatasetBuilder full = anImage("1.4").inStudy("1.2").inSeries("1.3");
    for (unsigned short i = 0; i < kMaxDifferences + 1; ++i)
        full.with(
            DcmTag(i < 0x1000 ? 0x0018 : 0x0020, static_cast<unsigned short>(0x8000 + i % 0x1000), EVR_LO),
            "value");
    TagFile file;
    file.addTagMap(full.map(), nullptr, true);
    // In a series of their own: what many images of one have to tell apart takes its time.
    for (int i = 0; i <= kMaxListedImages; ++i)
        file.addTagMap(anImage(("1.5." + std::to_string(i)).c_str()).inStudy("1.2").inSeries("1.6").map(),
                       nullptr, true);
    ASSERT_TRUE(file.writeCacheFile());
    const QJsonObject listed = json("/browser/studies/1.2/series/1.6/images?limit=5000");
    EXPECT_EQ(listed[QStringLiteral("images")].toArray().size(), kMaxListedImages);
    EXPECT_EQ(listed[QStringLiteral("count")].toInt(), kMaxListedImages + 1);
    const QJsonObject found = json("/browser/studies/1.2/difference?a=1.4&b=1.5.1");
    EXPECT_EQ(found[QStringLiteral("differences")].toArray().size(), kMaxDifferences);
    EXPECT_FALSE(found[QStringLiteral("complete")].toBool(true));
}

TEST_F(BrowserTest, DecodesTextsByTheCharacterSetOfTheirImage)
{
    write({anImage("1.4")
               .inStudy("1.2")
               .with(DCM_SpecificCharacterSet, "ISO_IR 100")
               .with(DCM_PatientName, "M\xfcller")});
    EXPECT_EQ(text(json("/browser/studies/1.2")[QStringLiteral("attributes")].toObject(), "PatientName"),
              "Müller");
}

TEST_F(BrowserTest, TellsInWhatImagesDiffer)
{
    write(study());
    const QJsonObject answer = json("/browser/studies/1.2/difference?a=1.4.4&b=1.4.5");
    const QJsonValue list = answer[QStringLiteral("differences")];
    EXPECT_EQ(list.toArray().size(), 4);  // own UID, number, description, the item's UID
    EXPECT_TRUE(entry(list, "00081030")[QStringLiteral("b")].isNull());
    EXPECT_EQ(text(entry(list, "00081155"), "path"), "(0008,1140)[0].");
    EXPECT_EQ(text(entry(list, "00081155")[QStringLiteral("b")].toObject(), "value"), "1.8");
    EXPECT_TRUE(json("/browser/studies/1.2/difference?a=1.4.4&b=1.4.4")[QStringLiteral("differences")]
                    .toArray()
                    .isEmpty());
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
    const QJsonArray corrections =
        json("/browser/studies/1.2/corrections")[QStringLiteral("corrections")].toArray();
    ASSERT_EQ(corrections.size(), 1);
    EXPECT_EQ(corrections[0][QStringLiteral("count")].toInt(), 2);
    EXPECT_TRUE(corrections[0][QStringLiteral("time")].toString().endsWith(QStringLiteral("anna")));
    const QJsonObject change = entry(corrections[0][QStringLiteral("changes")], "00100010");
    EXPECT_EQ(text(change, "old"), "Doe^Jane");
    EXPECT_EQ(text(change, "new"), "<b>New");
    EXPECT_TRUE(json("/browser/studies/1.2")[QStringLiteral("corrected")].toBool());
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
    const QJsonValue volume =
        QJsonValue(json("/browser/studies/1.2"))[QStringLiteral("series")][0][QStringLiteral("volumes")][0];
    EXPECT_EQ(volume[QStringLiteral("dims")].toArray(), (QJsonArray{512, 256, 2}));
    EXPECT_EQ(volume[QStringLiteral("spacing")].toArray(), (QJsonArray{0.5, 0.25, 2}));
    EXPECT_EQ(volume[QStringLiteral("origin")].toArray(), (QJsonArray{-10, -20, 30}));
    EXPECT_EQ(volume[QStringLiteral("plane")].toString(), QStringLiteral("sagittal"));
    EXPECT_EQ(volume[QStringLiteral("intercept")].toDouble(), -1024);
    for (const char* target :
         {"/browser/studies/1.2/series/1.3.1/volumes/0/preview", "/browser/studies/1.2/preview"})
        EXPECT_EQ(bodyOf(get(target)), info.preview) << target;
}
