#include "TagFileQAFixture.h"
#include "support/Process.h"

#include <thread>

namespace Kdd
{
namespace
{

/// Study 1.2: images 1 to 6 in series 1.2.3 with the volumes "1 2 3 4" and "5 6". Study 1.9: image 9 in series 1.9.1.
class TagFileQAMove : public TagFileQATest
{
protected:
    TagFileQAMove()
    {
        TagFile file;
        for (int i = 1; i <= 6; ++i) {
            const QByteArray number = QByteArray::number(i);
            add(file,
                anImage(number.constData())
                    .with(DCM_InstanceNumber, number.constData())
                    .with(DCM_ImageComments, "only of " + number)
                    .withItem(DCM_ReferencedStudySequence, anItem().with(DCM_PatientID, number.constData())));
        }
        addVolumes(file, {aVolume({"1", "2", "3", "4"}, "x-first.vol"), aVolume({"6", "5"}, "x-second.vol")});
        file.createAbstractTags();
        file.study()->putAndInsertInt(kFromDatabase, 1);
        file.optimizeAll();
        EXPECT_TRUE(file.writeCacheFile());
        TagFile other;
        add(other, anImage("9").inStudy("1.9").inSeries("1.9.1"));
        EXPECT_TRUE(other.writeCacheFile());
    }
};

TEST_F(TagFileQAMove, TakesImagesWithAllTheyShowToTheOtherStudy)
{
    const std::string first = kept(*stored("1.2")->findImage("1"));
    const std::string second = kept(*stored("1.2")->findImage("2"));
    QAData job = move({"1", "9", "nobody"}, "1.9.2");
    QString message;
    ASSERT_TRUE(TagFile::applyQA(job, message)) << message.toStdString();
    EXPECT_EQ(job.outcome.moved, 1);
    EXPECT_EQ(job.outcome.notFound, Uids{"nobody"});
    EXPECT_EQ(stored("1.2")->imagesByUID().keys(), (Uids{"2", "3", "4", "5", "6"}));
    EXPECT_EQ(stored("1.9")->imagesByUID().keys(), (Uids{"1", "9"}));
    EXPECT_EQ(kept(*stored("1.9")->findImage("1")), first);
    EXPECT_EQ(kept(*stored("1.2")->findImage("2")), second);
    EXPECT_EQ(shown("1.9", "1", DCM_StudyInstanceUID), "1.9");
    EXPECT_EQ(shown("1.9", "1", DCM_SeriesInstanceUID), "1.9.2");
    EXPECT_EQ(shown("1.9", "1", kAbstract), "none") << "what the old series said of itself";
    EXPECT_EQ(logOf(*stored("1.9")->findImage("1")).text(),
              "31/1/2024 12:00:00 PM anna\n0020-000e\n1.2.3\n1.9.2\n0020-000d\n1.2\n1.9\n\n");
    EXPECT_EQ(treeText(*stored("1.2")).find("only of 1"), std::string::npos)
        << "nothing of a patient's image stays with another patient";
}

TEST_F(TagFileQAMove, MakesANewStudyAndDeletesAnEmptyOne)
{
    EXPECT_TRUE(apply(move({"1", "2", "3", "4", "5", "6"}, "1.8.1", "1.8")));
    EXPECT_FALSE(QFile::exists(pathOf("1.2")));
    EXPECT_EQ(stored("1.8")->imagesByUID().size(), 6);
    EXPECT_TRUE(apply(move({"nobody"}, "1.7.1", "1.7", "1.8")));
    EXPECT_FALSE(QFile::exists(pathOf("1.7"))) << "nothing was moved to it";
}

TEST_F(TagFileQAMove, DividesVolumesByTheSeriesThatHoldTheirImages)
{
    EXPECT_TRUE(apply(move({"2", "3", "5", "6"}, "1.9.2")));
    const auto source = stored("1.2");
    const auto destination = stored("1.9");
    EXPECT_EQ(volumesOf(*source, "1.2.3"), "1 4");
    EXPECT_EQ(volumesOf(*destination, "1.9.2"), "2 3, 6 5");
    const QList<Volume*>& moved = destination->findSeries("1.9.2")->volumes();
    EXPECT_TRUE(moved.first()->isBareVolume()) << "its slices are no longer those of the file";
    EXPECT_EQ(moved.last()->dims().z, 2);
    EXPECT_EQ(moved.last()->fileNameSuffix(), "second");
    EXPECT_EQ(moved.last()->previewData(), "x-second.vol");
    TagMap* pictured = nullptr;
    EXPECT_EQ(destination->findImage("3")->findPreviewData(&pictured), "x-first.vol") << "its middle slice";
    EXPECT_TRUE(apply(move({"1", "4"}, "1.9.2")));
    EXPECT_EQ(volumesOf(*stored("1.9"), "1.9.2"), "2 3, 6 5, 1 4");
}

TEST_F(TagFileQAMove, InsideOfAStudyDividesThemToo)
{
    EXPECT_TRUE(apply(edit({"1", "2", "6"}, {{DCM_SeriesInstanceUID, text("1.2.4")}})));
    const auto file = stored();
    EXPECT_EQ(volumesOf(*file, "1.2.3"), "3 4, 5");
    EXPECT_EQ(volumesOf(*file, "1.2.4"), "1 2, 6");
    EXPECT_EQ(shown(*file->findImage("1"), DCM_SeriesInstanceUID), "1.2.4");
    EXPECT_EQ(shown(*file->findImage("6"), kFromDatabase), "01") << "what the study says of itself";
    EXPECT_EQ(shown(*file->findImage("6"), kAbstract) + ", " + shown(*file->findImage("3"), kAbstract),
              "Series (2), Series (1)")
        << "labels tell series apart";
}

TEST_F(TagFileQAMove, SlicesKeepTheirImagesWhenNumbersOrUidsChange)
{
    EXPECT_TRUE(apply(edit({"2"}, {{DCM_InstanceNumber, text("99")}})));
    EXPECT_EQ(volumesOf(*stored(), "1.2.3"), "1 2 3 4, 6 5");
    EXPECT_TRUE(apply(edit({"3"}, {{DCM_SOPInstanceUID, text("33")}})));
    EXPECT_EQ(volumesOf(*stored(), "1.2.3"), "1 2 33 4, 6 5");
}

TEST_F(TagFileQAMove, ThatEndedBetweenTheTwoWritesIsCompletedByTheNextRun)
{
    const QByteArray before = content();
    const QAData job = move({"1", "2"}, "1.9.2");
    EXPECT_TRUE(apply(job));
    put(path(), before);
    QAData meanwhile = edit({"1"}, {{DCM_PatientName, text("Meanwhile")}});
    meanwhile.studyUID = "1.9";
    EXPECT_TRUE(apply(meanwhile));
    EXPECT_TRUE(apply(job));
    EXPECT_EQ(stored("1.2")->imagesByUID().keys(), (Uids{"3", "4", "5", "6"}));
    EXPECT_EQ(volumesOf(*stored("1.2"), "1.2.3"), "3 4, 6 5");
    EXPECT_EQ(volumesOf(*stored("1.9"), "1.9.2"), "1 2");
    EXPECT_EQ(shown("1.9", "1", DCM_PatientName), "Meanwhile");
    EXPECT_EQ(logOf(*stored("1.9")->findImage("1")).text().count("0020-000e"), 1);
}

TEST_F(TagFileQAMove, ReplacesAnImageOfTheSameUid)
{
    const LogCapture log;
    TagFile other;
    add(other, anImage("1").inStudy("1.9").inSeries("1.9.1").with(DCM_PatientName, "Other"));
    ASSERT_TRUE(other.mergeIntoCacheFile());
    ASSERT_TRUE(other.readCacheFileForStudy("1.9", true));
    addVolumes(other, {aVolume({"9", "1"}, "x-both.vol")});
    ASSERT_TRUE(other.writeCacheFile());
    EXPECT_TRUE(apply(move({"1"}, "1.9.1")));
    EXPECT_EQ(log.count("Image 1 of study 1.2 replaces the one that study 1.9 had"), 1);
    EXPECT_EQ(shown("1.9", "1", DCM_ImageComments), "only of 1");
    EXPECT_EQ(stored("1.9")->imagesByUID().size(), 2);
    EXPECT_EQ(volumesOf(*stored("1.9"), "1.9.1"), "9 1, 1");
}

TEST_F(TagFileQAMove, ThatCannotBeWrittenLeavesBothStudiesAsTheyWere)
{
    const LogCapture quiet;
    TagFile::setCompressionMode(Mode::None);
    TagFile file;
    ASSERT_TRUE(file.readCacheFileForStudy("1.2", true));
    file.findImage("2")->putAndInsertValue(DCM_TextValue, VrCode::UT, QByteArray(1000000, 'x'));
    ASSERT_TRUE(file.writeCacheFile());
    for (const char* destination : {"1.9", "1.8"}) {
        for (const QByteArray& image : {QByteArray("1"), QByteArray("2")}) {
            const QByteArray before[] = {content(), content(pathOf(destination))};
            {
                const FullDisk forTheLargerFile(500000);
                EXPECT_NE(refusal(move({image}, "1.9.2", destination)), "");
            }
            EXPECT_EQ(content(), before[0]);
            EXPECT_EQ(content(pathOf(destination)), before[1]) << destination << " of " << image.constData();
        }
    }
    TagFile::setCompressionMode(Mode::Zlib);
    EXPECT_TRUE(apply(move({"1", "2"}, "1.9.2")));
}

/// Both studies are held from before they are read until after they are written.
TEST_F(TagFileQAMove, InOppositeDirectionsAtOnceLoseNothing)
{
    const auto moveAll = [](const char* from, const char* to) {
        for (int i = 1; i <= 6; ++i) {
            QAData job = move({QByteArray::number(i)}, (QByteArray(to) + ".5").constData(), to, from);
            QString message;
            while (!TagFile::applyQA(job, message) && job.outcome.isLockedOut) {
            }
            EXPECT_EQ(message, QString());
        }
    };
    std::thread there(moveAll, "1.2", "1.9");
    std::thread back(moveAll, "1.9", "1.2");
    there.join();
    back.join();
    EXPECT_EQ(stored("1.2")->imagesByUID().size() + stored("1.9")->imagesByUID().size(), 7);
}

TEST_F(TagFileQAMove, OfAHeldStudyIsToBeTriedAgain)
{
    TagFile holder;
    ASSERT_TRUE(holder.readCacheFileForStudy("1.2", true));
    QAData job = move({"1"}, "1.9.2");
    QString message;
    EXPECT_FALSE(TagFile::applyQA(job, message));
    EXPECT_TRUE(job.outcome.isLockedOut);
    EXPECT_EQ(message, text("The tag file of study 1.2 cannot be changed: others hold it"));
}

}  // namespace
}  // namespace Kdd
