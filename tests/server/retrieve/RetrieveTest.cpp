#include "server/retrieve/RetrieveFixture.h"

using namespace Kdd;
using namespace Kdd::DicomWeb;

namespace
{

TEST_F(RetrieveTest, GivesFramesInTheOrderAskedFor)
{
    add("a.dcm", anImageWithFrames(3));
    Http::Response response = get(kInstance + "/frames/3,1,3");
    EXPECT_TRUE(std::holds_alternative<Http::FileRange>(response.body.at(1))) << "left in the file";
    const QByteArray head = "Content-Type: application/octet-stream; transfer-syntax=1.2.840.10008.1.2.1";
    EXPECT_EQ(partsOf(response), (Parts{{head, frameOf(2)}, {head, frameOf(0)}, {head, frameOf(2)}}));
}

/// A path below the instance, what the client takes, and the status.
const std::tuple<const char*, const char*, int> kRefusals[] = {
    {"/frames/0", "*/*", 404},
    {"/frames/3", "*/*", 404},
    {"/frames/99999999999", "*/*", 400},
    {"/frames/1,x", "*/*", 400},
    {"/frames/+1", "*/*", 400},
    {"/frames/1,,2", "*/*", 400},
    {"/frames/-1", "*/*", 400},
    {"/frames/1", "image/jp2", 406},
    {"/frames/1,2", "application/octet-stream", 406},
    {"", "image/jpeg", 406},
    {"", "application/dicom; transfer-syntax=1.2.840.10008.1.2.4.91", 406},
    {"/bulkdata/00100010", "image/jpeg", 406},
    {"/bulkdata/0010001", "*/*", 400},
    {"/bulkdata/00100010/0", "*/*", 400},
    {"/bulkdata/00104000", "*/*", 404},
    {"/bulkdata/00067100", "*/*", 404},
    {"/pixeldata", "image/gif", 406},
};

TEST_F(RetrieveTest, RefusesWhatIsNotThereOrCannotBeGiven)
{
    add("a.dcm", anImageWithFrames(2));
    for (const auto& [path, accept, status] : kRefusals)
        EXPECT_EQ(get(kInstance + path, accept).status, status) << path;
    const QByteArray most = kInstance + "/frames/1" + QByteArray(",1").repeated(9999);
    EXPECT_EQ(get(most, "*/*").status, 200);
    EXPECT_EQ(get(most + ",1", "*/*").status, 400);
    EXPECT_EQ(get("studies/1.9").status, 404);
    EXPECT_EQ(get("studies/1.2/series/1.9").status, 404);
    EXPECT_EQ(get("studies/1.2/series/1.9/instances/1.2.3.1").status, 404) << "of another series";
}

TEST_F(RetrieveTest, ShowsCorrectionsByEveryResource)
{
    add("a.dcm", anImageWithFrames(2));
    EXPECT_EQ(bodyOf(get(kInstance, kStored)), fileContent(path("a.dcm")));
    correct(DCM_PatientName, "Right^Name");
    for (const char* accept :
         {"application/dicom", kStored, "application/dicom; transfer-syntax=1.2.840.10008.1.2"}) {
        EXPECT_EQ(nameIn(bodyOf(get(kInstance, accept))), "Right^Name") << accept;
    }
    EXPECT_EQ(bodyOf(get(kInstance + "/bulkdata/00100010")), "Right^Name");
    EXPECT_EQ(bodyOf(get(kInstance + "/frames/1", "application/octet-stream")), frameOf(0));
}

TEST_F(RetrieveTest, FindsMovedAndRenamedImagesWhereTheyAreNow)
{
    add("a.dcm", anImageWithFrames(1));
    add("b.dcm", anImageWithFrames(1, "1.7.1").inStudy("1.7").inSeries("1.7.7"));
    correct(DCM_SOPInstanceUID, "1.2.3.9", "1.2", "1.7");
    const QByteArray moved = "studies/1.7/series/1.2.3/instances/1.2.3.9";
    EXPECT_EQ(bodyOf(get(moved + "/frames/1", "application/octet-stream")), frameOf(0));
    const QByteArray dicom = bodyOf(get(moved, kStored));
    EXPECT_EQ(nameIn(dicom, DCM_SOPInstanceUID), "1.2.3.9");
    EXPECT_EQ(nameIn(dicom, DCM_StudyInstanceUID), "1.7");
    EXPECT_EQ(get(kInstance + "/frames/1").status, 404);
    EXPECT_EQ(get("studies/1.7/series/1.2.3/instances/1.2.3.1").status, 404);
    const QByteArray byUri = QByteArray(kObject).replace("1.2&", "1.7&").replace("1.2.3.1", "1.2.3.9");
    EXPECT_EQ(nameIn(bodyOf(getByUri(byUri + "contentType=application/dicom")), DCM_SOPInstanceUID),
              "1.2.3.9");
    EXPECT_EQ(getByUri(byUri + "contentType=image/jpeg").status, 200);
    for (const char* form : {"contentType=application/dicom", "contentType=image/jpeg"})
        EXPECT_EQ(getByUri(kObject + form).status, 404) << form;
}

TEST_F(RetrieveTest, NeverGivesAnotherImage)
{
    add("a.dcm", anImageWithFrames(1));
    const auto statuses = [&] {
        QSet<int> all;
        for (const char* below : {"", "/frames/1", "/bulkdata/7FE00010", "/pixeldata", "/rendered"})
            all.insert(get(kInstance + below).status);
        for (const char* form :
             {"application/dicom", "application/dicom&transferSyntax=1.2.840.10008.1.2.5", "image/jpeg"})
            all.insert(getByUri(kObject + "contentType=" + form).status);
        return all;
    };
    EXPECT_EQ(statuses(), QSet<int>{200});

    write("a.dcm", anImageWithFrames(1, "1.2.3.2"));
    EXPECT_EQ(statuses(), QSet<int>{410}) << "another image's file";
    write("a.dcm", anImageWithFrames(1).inStudy("1.9"));
    EXPECT_EQ(statuses(), QSet<int>{410}) << "of another study";
    QFile(path("a.dcm")).resize(QFile(path("a.dcm")).size() - 10);
    EXPECT_EQ(statuses(), QSet<int>{500}) << "cut";
    QFile::remove(path("a.dcm"));
    EXPECT_EQ(statuses(), QSet<int>{410}) << "gone";
    EXPECT_FALSE(bodyOf(get(kInstance + "/rendered")).contains("a.dcm"));
}

TEST_F(RetrieveTest, PacksStudiesAndLeavesOutWhatIsGone)
{
    add("a.dcm", anImageWithFrames(1));
    add("b.dcm", anImageWithFrames(2, "1.2.3.2"), EXS_RLELossless);
    add("c.dcm", anImageWithFrames(1, "1.2.3.3").inSeries("1.2.4"));
    Http::Response study = get("studies/1.2");
    EXPECT_EQ(study.status, 200);
    EXPECT_EQ(partsOf(study).size(), 3);
    const auto parts = partsOf(
        get("studies/1.2/series/1.2.3", "multipart/related; type=application/dicom; transfer-syntax=*"));
    ASSERT_EQ(parts.size(), 2);
    EXPECT_TRUE(parts.contains({"Content-Type: application/dicom; transfer-syntax=1.2.840.10008.1.2.5",
                                fileContent(path("b.dcm"))}));
    EXPECT_TRUE(
        bodyOf(get("studies/1.2", "application/zip; transfer-syntax=*")).contains("1.2/1.2.4/1.2.3.3.dcm"));
    QFile::remove(path("a.dcm"));
    Http::Response rest = get("studies/1.2");
    EXPECT_EQ(rest.status, 206);
    EXPECT_EQ(partsOf(rest).size(), 2);
}

TEST_F(RetrieveTest, GivesValuesThatWereLeftOutAndRangesOfThem)
{
    const QByteArray document = QByteArray("%PDF-") + QByteArray(4995, 'x');
    DatasetBuilder image = anImage().with(DCM_MIMETypeOfEncapsulatedDocument, "application/pdf");
    image.withItem(DCM_ContentSequence, anItem());
    image.withItem(DCM_ContentSequence, anItem().withLong(DCM_TextValue, 3000));
    add("a.dcm", image.data(DCM_EncapsulatedDocument, document));
    const QByteArray value = kInstance + "/bulkdata/00420011";
    Http::Response whole = get(value);
    EXPECT_EQ(headerOf(whole, "Content-Type"), "application/pdf");
    EXPECT_EQ(bodyOf(whole), document);
    Http::Response part = get(value, "application/octet-stream", "bytes=2-6");
    EXPECT_EQ(part.status, 206);
    EXPECT_EQ(headerOf(part, "Content-Range"), "bytes 2-6/5000");
    EXPECT_EQ(bodyOf(part), document.mid(2, 5));
    EXPECT_EQ(get(value, "*/*", "bytes=5000-").status, 416);
    EXPECT_EQ(bodyOf(get(kInstance + "/bulkdata/0040A730/1/0040A160")), QByteArray(3000, 'x'));
    EXPECT_EQ(get(kInstance + "/bulkdata/0040A730/0/0040A160").status, 404);
    const auto parts = partsOf(get("studies/1.2/bulkdata"));
    ASSERT_EQ(parts.size(), 2);
    EXPECT_TRUE(parts[0].first.endsWith(
                    "Content-Location: series/1.2.3/instances/1.2.3.1/bulkdata/0040A730/1/0040A160") ||
                parts[1].first.endsWith(
                    "Content-Location: series/1.2.3/instances/1.2.3.1/bulkdata/0040A730/1/0040A160"));
}

}  // namespace
