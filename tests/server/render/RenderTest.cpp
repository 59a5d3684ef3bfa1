#include "server/Handled.h"
#include "server/dicomweb/render/RenderedResource.h"
#include "server/dicomweb/render/ThumbnailResource.h"
#include "support/DatasetBuilder.h"
#include "support/LogCapture.h"
#include "support/TemporaryStore.h"

#include <QBuffer>
#include <QFile>
#include <QImage>

#include <gtest/gtest.h>
#include <kddlib/OwnAttributes.h>
#include <kddlib/TagFileGenerator.h>
#include <kddlib/TagMap.h>

using namespace Kdd;
using namespace Kdd::DicomWeb;

namespace
{

constexpr int kSide = 8;
constexpr int kFrames = 3;
constexpr const char* kPath = "studies/1.2/series/1.3/instances/1.4/";

/// In each frame the values go up by one from pixel to pixel, from the frame's number times 100 on.
DatasetBuilder aGreyImage()
{
    std::vector<Uint16> pixels;
    for (int frame = 0; frame < kFrames; ++frame)
        for (int i = 0; i < kSide * kSide; ++i)
            pixels.push_back(static_cast<Uint16>(frame * 100 + i));
    DatasetBuilder image = anImage("1.4").inSeries("1.3");
    return image.asPicture(kSide, kSide, 16).with(DCM_NumberOfFrames, "3").words(pixels);
}

class RenderTest : public testing::Test
{
protected:
    void SetUp() override { store(aGreyImage()); }

    /// Writes the file and the tag file of the study; what the tag file says of the image may be another than what its
    /// file says.
    void store(const DatasetBuilder& image, const char* windowCenter = nullptr,
               const QByteArray& preview = {})
    {
        image.save(mFile);
        std::unique_ptr<TagMap> map(image.map());
        if (windowCenter != nullptr)
            map->putAndInsertValue(DCM_WindowCenter, VrCode::DS, windowCenter);
        if (!preview.isEmpty())
            map->putAndInsertValue(kPreview, VrCode::OB, preview);
        TagFile tags;
        ASSERT_NE(TagFileGenerator::place(tags, std::move(map), QFile::encodeName(mFile)), nullptr);
        ASSERT_TRUE(tags.writeCacheFile());
    }

    Http::Response ask(const QByteArray& what, QVector<Http::Field> query = {},
                       const char* accept = "image/png")
    {
        Http::Request request = requestFor(what.startsWith("studies") ? what : kPath + what,
                                           {{"accept", accept}, {"if-none-match", mHeld}});
        request.query = std::move(query);
        ResourcePath path;
        EXPECT_TRUE(ResourcePath::parse(request.path, path));
        return mRendered.owns(path) ? mRendered.answer(request, path) : mThumbnail.answer(request, path);
    }

    QImage picture(const QByteArray& what, QVector<Http::Field> query = {})
    {
        const Http::Response response = ask(what, std::move(query));
        EXPECT_EQ(response.status, 200) << what.constData() << ": " << bodyOf(response).constData();
        return QImage::fromData(bodyOf(response));
    }

    TemporaryStore mStore;
    LogCapture mLog;
    std::shared_ptr<StudyShelf> mShelf =
        std::make_shared<StudyShelf>(1 << 30, std::chrono::nanoseconds(-1'000'000'000));
    std::shared_ptr<ObjectShelf> mObjects = std::make_shared<ObjectShelf>(1 << 20);
    RenderedResource mRendered{mShelf, mObjects};
    ThumbnailResource mThumbnail{mShelf, mObjects};
    const QString mFile = mStore.filePath("image.dcm");
    QByteArray mHeld;  // tags that the client says it has
};

QByteArray tagOf(const Http::Response& response)
{
    return headerOf(response, "ETag");
}

TEST_F(RenderTest, ShowsValuesByTheWindowThatIsAskedFor)
{
    // The value of a pixel is its number.
    const std::tuple<const char*, int, int> kLevels[] = {
        {"32,32,linear-exact", 16, 0},
        {"32,32,linear-exact", 32, 127},
        {"32,32,linear-exact", 48, 255},
        {"32,32,linear-exact", 40, 191},
        {"32,32", 40, 197},
        {"32,16,sigmoid", 32, 127},
        {"32,16,sigmoid", 36, 186},
        {"32,16,sigmoid", 28, 68},
        {"1000,10,linear", 63, 0},
    };
    for (const auto& [window, pixel, level] : kLevels) {
        const QImage shown = picture("frames/1/rendered", {{"window", window}});
        EXPECT_NEAR(qRed(shown.pixel(pixel % kSide, pixel / kSide)), level, 1) << window << " of " << pixel;
    }
}

TEST_F(RenderTest, FollowsACorrectedWindow)
{
    store(aGreyImage().with("WindowCenter=32|WindowWidth=32"));
    const int before = qRed(picture("frames/1/rendered").pixel(0, 4));
    store(aGreyImage().with("WindowCenter=32|WindowWidth=32"), "24");
    EXPECT_GT(qRed(picture("frames/1/rendered").pixel(0, 4)), before + 50);
}

TEST_F(RenderTest, GivesTheFramesThatAreAskedFor)
{
    const QVector<Http::Field> window = {{"window", "150,300,linear-exact"}};
    const int first = qRed(picture("frames/1/rendered", window).pixel(0, 0));
    const int last = qRed(picture("frames/3/rendered", window).pixel(0, 0));
    EXPECT_NEAR(last - first, 170, 2);

    const Http::Response parts = ask("rendered", window, "multipart/related; type=image/png");
    ASSERT_EQ(parts.status, 200);
    EXPECT_EQ(bodyOf(parts).count("Content-Type: image/png"), kFrames);
}

TEST_F(RenderTest, CutsTurnsAndFitsIntoTheViewport)
{
    EXPECT_EQ(picture("rendered").size(), QSize(8, 8));
    EXPECT_EQ(picture("rendered", {{"viewport", "100,40"}}).size(), QSize(40, 40));
    EXPECT_EQ(picture("rendered", {{"viewport", "4,4"}}).size(), QSize(4, 4));
    const QVector<Http::Field> turned = {{"viewport", "8,1,0,1,-8,1"}, {"window", "32,64,linear-exact"}};
    const QImage row = picture("frames/1/rendered", turned);
    EXPECT_EQ(row.size(), QSize(8, 1));
    EXPECT_GT(qRed(row.pixel(0, 0)), qRed(row.pixel(7, 0)));
}

TEST_F(RenderTest, RefusesWithTheRightStatus)
{
    const std::tuple<const char*, Http::Field, const char*, int> kRefusals[] = {
        {"frames/4/rendered", {}, "image/png", 404},
        {"frames/0/rendered", {}, "image/png", 400},
        {"frames/1,2/rendered", {}, "image/png", 406},
        {"rendered", {"window", "1,0,linear"}, "image/png", 400},
        {"rendered", {"window", "1,nan"}, "image/png", 400},
        {"rendered", {"window", "1,2,cubic"}, "image/png", 400},
        {"rendered", {"viewport", "0,5"}, "image/png", 400},
        {"rendered", {"viewport", "9000,5"}, "image/png", 400},
        {"rendered", {"viewport", "8,8,20,0"}, "image/png", 400},
        {"rendered", {"quality", "101"}, "image/png", 400},
        {"rendered", {}, "image/webp", 406},
        {"thumbnail", {}, "image/png", 406},
        {"studies/1.3/rendered", {}, "image/png", 404},
    };
    for (const auto& [what, query, accept, status] : kRefusals)
        EXPECT_EQ(ask(what, {query}, accept).status, status) << what << ' ' << query.value.constData();
}

TEST_F(RenderTest, MakesThumbnailsOfWhatIsStoredWhereThatDoes)
{
    EXPECT_EQ(QImage::fromData(bodyOf(ask("thumbnail", {}, "*/*"))).size(), QSize(256, 256));

    QImage stored(64, 32, QImage::Format_RGB32);
    stored.fill(Qt::darkGreen);
    QByteArray preview;
    QBuffer buffer(&preview);
    stored.save(&buffer, "JPEG");
    store(aGreyImage(), nullptr, preview);
    for (const char* level : {"studies/1.2/thumbnail", "studies/1.2/series/1.3/thumbnail",
                              "studies/1.2/series/1.3/instances/1.4/thumbnail"})
        EXPECT_EQ(bodyOf(ask(level, {}, "image/jpeg")), preview) << level;
    EXPECT_EQ(bodyOf(ask("thumbnail", {{"viewport", "256,256"}}, "image/*")), preview);
    EXPECT_EQ(QImage::fromData(bodyOf(ask("thumbnail", {{"viewport", "32,32"}}, "image/jpeg"))).size(),
              QSize(32, 16));
    EXPECT_EQ(QImage::fromData(bodyOf(ask("frames/2/thumbnail", {}, "image/jpeg"))).size(), QSize(256, 256));
}

TEST_F(RenderTest, TellsThatAPictureIsTheSameAsLongAsItIs)
{
    for (const char* what : {"rendered", "frames/2/rendered", "thumbnail", "studies/1.2/rendered"}) {
        store(aGreyImage());
        mHeld.clear();
        mHeld = tagOf(ask(what, {}, "image/jpeg"));
        ASSERT_FALSE(mHeld.isEmpty()) << what;
        const Http::Response same = ask(what, {}, "image/jpeg");
        EXPECT_EQ(same.status, 304) << what;
        EXPECT_EQ(tagOf(same), mHeld);
        EXPECT_EQ(ask(what, {{"viewport", "4,4"}}, "image/jpeg").status, 200) << what;
        EXPECT_EQ(ask(what, {{"window", "5,5"}}, "image/jpeg").status, 200) << what;
        store(aGreyImage(), "24");
        EXPECT_EQ(ask(what, {}, "image/jpeg").status, 200) << what << " corrected";
        mHeld = tagOf(ask(what, {}, "image/jpeg"));
        aGreyImage().words(std::vector<Uint16>(kFrames * kSide * kSide, 7)).save(mFile);
        EXPECT_EQ(ask(what, {}, "image/jpeg").status, 200) << what << " of other pixels";
        ASSERT_TRUE(QFile::remove(mFile));
        EXPECT_EQ(ask(what, {}, "image/jpeg").status, 410) << what;
    }
    mHeld.clear();
    store(aGreyImage());
    EXPECT_NE(tagOf(ask("rendered", {}, "image/jpeg")), tagOf(ask("rendered", {}, "image/png")));
}

TEST_F(RenderTest, ShowsADocumentAsItIs)
{
    const QByteArray document = QByteArray("%PDF-") + QByteArray(4995, 'x');
    DatasetBuilder image = anImage("1.4").inSeries("1.3");
    image.with(DCM_MIMETypeOfEncapsulatedDocument, "application/pdf");
    store(image.data(DCM_EncapsulatedDocument, document));
    for (const char* accept : {"*/*", "application/pdf", "image/webp,application/pdf;q=0.5"}) {
        const Http::Response shown = ask("rendered", {}, accept);
        ASSERT_EQ(shown.status, 200) << accept;
        EXPECT_EQ(headerOf(shown, "Content-Type"), "application/pdf");
        EXPECT_TRUE(std::holds_alternative<Http::FileRange>(shown.body.front()));
        EXPECT_EQ(bodyOf(shown), document);
    }
    EXPECT_EQ(ask("rendered", {}, "image/jpeg").status, 406);
    mHeld = tagOf(ask("rendered", {}, "*/*"));
    EXPECT_EQ(ask("rendered", {}, "*/*").status, 304);
    store(anImage("1.4").inSeries("1.3").with(DCM_MIMETypeOfEncapsulatedDocument, "text/html"));
    EXPECT_EQ(ask("rendered", {}, "*/*").status, 404) << "nothing that a browser would run";
}

DatasetBuilder aLine(const char* type, const char* name)
{
    return anItem()
        .with(DCM_ValueType, type)
        .withItem(DCM_ConceptNameCodeSequence, anItem().with(DCM_CodeMeaning, name));
}

TEST_F(RenderTest, TellsWhatAReportSaysAndNothingAsMarkup)
{
    const QByteArray hostile = "<script>alert(1)</script> & \"quoted\"\r\nM\xfcller";
    const DatasetBuilder unit = anItem().with(DCM_CodeValue, "mm");
    const DatasetBuilder measured =
        anItem().with(DCM_NumericValue, "12.5").withItem(DCM_MeasurementUnitsCodeSequence, unit);
    const DatasetBuilder number = aLine("NUM", "Diameter").withItem(DCM_MeasuredValueSequence, measured);
    DatasetBuilder inner = aLine("CONTAINER", "Findings").withItem(DCM_ContentSequence, number);
    inner.withItem(DCM_ContentSequence, aLine("TEXT", "Text").with(DCM_TextValue, hostile));
    inner.withItem(DCM_ContentSequence, aLine("TEXT", "Long").withLong(DCM_TextValue, 5000));
    DatasetBuilder report = anImage("1.4").inSeries("1.3").with(DCM_ValueType, "CONTAINER");
    report.with("SpecificCharacterSet=ISO_IR 100|VerificationFlag=UNVERIFIED");
    store(report.withItem(DCM_ContentSequence, inner));

    const QByteArray text = bodyOf(ask("rendered", {}, "text/plain"));
    EXPECT_TRUE(text.contains("Verification: UNVERIFIED\n")) << text.constData();
    EXPECT_TRUE(text.contains("\n  Findings\n    Diameter: 12.5 mm\n    Text: <script>")) << text.constData();
    EXPECT_TRUE(text.contains("\n    M\xc3\xbcller\n"));
    EXPECT_TRUE(text.contains("    Long: " + QByteArray(5000, 'x')));
    const Http::Response page = ask("rendered", {}, "*/*");
    EXPECT_EQ(headerOf(page, "Content-Type"), "text/html; charset=utf-8");
    EXPECT_FALSE(bodyOf(page).contains("<script"));
    EXPECT_TRUE(bodyOf(page).contains(
        "<b>Text: </b>&lt;script&gt;alert(1)&lt;/script&gt; &amp; &quot;quoted&quot;<br>"));
    EXPECT_EQ(bodyOf(page).count("<ul>"), bodyOf(page).count("</ul>"));
    EXPECT_EQ(ask("rendered", {}, "image/jpeg").status, 406);
    mHeld = tagOf(page);
    EXPECT_EQ(ask("rendered", {}, "*/*").status, 304);
    EXPECT_EQ(ask("rendered", {}, "text/plain").status, 200);
}

}  // namespace
