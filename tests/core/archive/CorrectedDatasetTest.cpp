#include "kddlib/archive/CorrectedDataset.h"

#include "core/archive/WholeDataset.h"
#include "kddlib/Limits.h"
#include "kddlib/archive/DatasetVerifier.h"
#include "kddlib/tagfile/qa/QAAudit.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"
#include "support/DatasetBuilder.h"
#include "support/FileContent.h"
#include "support/RealImage.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>

using namespace Kdd;

namespace
{

using Map = std::unique_ptr<TagMap>;

/// The faults that a check of the archive would find; "" for none.
std::string faultsOf(const QByteArray& bytes, const TagMap& image, bool isDecoded = false)
{
    DcmFileFormat file;
    std::string faults;
    const OFCondition read = readDicomBuffer(bytes, file);
    if (read.bad())
        return std::string("cannot be read: ") + read.text();
    verifyDataset(*file.getDataset(), image, [&](const QByteArray& path, const QByteArray& fault) {
        // What decoding is there to change, and numbers whose sign is told only where their VR has to be written.
        const bool isPixels = path == "(0028,0004)" || path == "(0028,0006)" || path == "(7fe0,0010)" ||
                              path == "(7fe0,0001)" || path == "(7fe0,0002)";
        const bool isWanted = (isDecoded && isPixels) || fault.endsWith("in the tag file xs");
        faults += isWanted ? std::string() : (path + ' ' + fault + '\n').toStdString();
    });
    return faults;
}

std::string uidInMeta(const QByteArray& bytes)
{
    DcmFileFormat file;
    OFString uid;
    readDicomBuffer(bytes, file);
    file.getMetaInfo()->findAndGetOFString(DCM_MediaStorageSOPInstanceUID, uid);
    return uid;
}

/// A frame of it is smaller than its image, or is no whole codestream.
bool isDamaged(const QString& path)
{
    return path.endsWith(QLatin1String("multiframe/sc/multiframe.dcm")) ||
           path.endsWith(QLatin1String("JPEG2000-embedded-sequence-delimiter.dcm"));
}

using RealDatasets = RealImages;

TEST_F(RealDatasets, AreAsTheirFilesAreUntilCorrectedAndThenAsTheTagFileShowsInEverySyntax)
{
    int asInFile = 0;
    int decoded = 0;
    forEach({"transfer-syntaxes", "multiframe", "modalities", "charsets", "odd"}, [&](const QString& path,
                                                                                      RealImage& real) {
        const Map map(TagMap::createTagMap(real.file.getDataset(), kDefaultValueBound));
        const QByteArray stored = real.index.transferSyntaxUID();
        CorrectedDataset unchanged;
        ASSERT_TRUE(unchanged.make(real.source, real.index, *map, stored).good());
        EXPECT_TRUE(unchanged.isAsInFile());
        EXPECT_EQ(faultsOf(wholeOf(unchanged, real.source, real.index, stored), *map), "");
        ++asInFile;

        map->putAndInsertString(DCM_PatientName, "Corrected^Name");
        map->deleteElement(DCM_StudyDate);
        map->putAndInsertString(DCM_SOPInstanceUID, "1.2.3.4.5.6.7");
        for (const QByteArray& syntax :
             QVector<QByteArray>{stored, "1.2.840.10008.1.2.1", "1.2.840.10008.1.2"} +
                 real.index.encodings().mid(0, 1)) {
            const bool isDecoded =
                syntax != stored && (real.index.isEncapsulated() || real.index.encodings().contains(syntax));
            // Without VRs what the dictionary does not know loses its own.
            const bool isLoss = syntax == "1.2.840.10008.1.2" && stored != syntax;
            if (isLoss || (isDecoded && (!real.index.canDecode() || isDamaged(path))))
                continue;
            CorrectedDataset dataset;
            const Result made = dataset.make(real.source, real.index, *map, syntax);
            ASSERT_TRUE(made.good()) << qPrintable(made.text());
            EXPECT_FALSE(dataset.isAsInFile());
            const QByteArray whole = wholeOf(dataset, real.source, real.index, syntax);
            EXPECT_EQ(faultsOf(whole, *map, isDecoded), "") << syntax.constData();
            EXPECT_EQ(uidInMeta(whole), map->uid(TagMap::ImageLevel).toStdString());
            decoded += isDecoded ? 1 : 0;
        }
    });
    EXPECT_GT(asInFile, 200);
    EXPECT_GT(decoded, 50);
}

class CorrectedDatasetTest : public FileTest
{
protected:
    CorrectedDatasetTest()
    {
        DatasetBuilder item = anItem().with(DCM_CodeMeaning, "wrong").withLong(DCM_TextValue, 5000);
        mImage.with(DCM_PatientName, "Wrong^Name")
            .withItem(DCM_ContentSequence, item)
            .withLong(DCM_TextValue, 3000);
        write();
    }

    void write()
    {
        mImage.save(path());
        mSource = ByteSource::ofFile(path());
        ASSERT_TRUE(mIndex.read(mSource).good());
    }

    Result make(const TagMap& image) { return mDataset.make(mSource, mIndex, image, "1.2.840.10008.1.2.1"); }
    QByteArray whole() { return wholeOf(mDataset, mSource, mIndex, ""); }

    DatasetBuilder mImage = anImage();
    ByteSource mSource = ByteSource({});
    FrameIndex mIndex;
    CorrectedDataset mDataset;
};

TEST_F(CorrectedDatasetTest, KeepsWhatWasLeftOutBesideACorrectionInAnItem)
{
    const Map map(mImage.map());
    map->findElement(QStringLiteral("ContentSequence[0]"), DCM_CodeMeaning)->putValue(QByteArray("right"));
    ASSERT_TRUE(make(*map).good());
    EXPECT_EQ(faultsOf(whole(), *map), "");
    EXPECT_TRUE(whole().contains("right") && !whole().contains("wrong"));
    EXPECT_TRUE(whole().contains(QByteArray(5000, 'x')));
}

TEST_F(CorrectedDatasetTest, RefusesAFileThatLacksWhatWasLeftOut)
{
    const Map map(mImage.map());
    mImage.without(DCM_TextValue);
    write();
    EXPECT_FALSE(make(*map).good());
    mImage.withLong(DCM_TextValue, 3000).without(DCM_ContentSequence);
    write();
    EXPECT_FALSE(make(*map).good());
    mImage.withItem(DCM_ContentSequence, anItem().withLong(DCM_TextValue, 5000));
    write();
    EXPECT_TRUE(make(*map).good());
}

TEST_F(CorrectedDatasetTest, LeavesOwnAttributesOutAndTheAuditLogIn)
{
    const Map map(mImage.map());
    AuditLog log;
    log.append({QStringLiteral("1/1/2024 12:00:00 AM"),
                {{DCM_PatientName, QStringLiteral("a"), QStringLiteral("b")}}});
    map->putAndInsertValue(kFilePath, VrCode::LO, "/secret/place");
    log.store(*map);
    ASSERT_TRUE(make(*map).good());
    EXPECT_FALSE(whole().contains("secret"));
    EXPECT_TRUE(whole().contains(log.text().toBase64()));
}

TEST(ImageOrigin, IsWhatTheFileSaysBeforeAllCorrections)
{
    const Map map(anImage("1.2.9").map());
    AuditLog log;
    ImageOrigin origin;
    EXPECT_FALSE(ImageOrigin::of(*map, origin).good()) << "no file is known";
    map->putAndInsertValue(kFilePath, VrCode::LO, "/place");
    const QString first = QStringLiteral("1.2.7");
    log.append({QStringLiteral("1"), {{DCM_SOPInstanceUID, first, QStringLiteral("1.2.8")}}});
    log.append(
        {QStringLiteral("2"), {{DCM_SOPInstanceUID, QStringLiteral("1.2.8"), QStringLiteral("1.2.9")}}});
    log.store(*map);
    ASSERT_TRUE(ImageOrigin::of(*map, origin).good());
    EXPECT_EQ(origin.sopInstanceUID, "1.2.7");
    EXPECT_EQ(origin.studyInstanceUID, "1.2");
    map->putAndInsertValue(AuditLog::keysIn(*map).first(), VrCode::UT, "no base64!");
    EXPECT_FALSE(ImageOrigin::of(*map, origin).good());
}

}  // namespace
