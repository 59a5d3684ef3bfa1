#include "BrowserFixture.h"
#include "server/browser/ShownValue.h"
#include "support/Gzip.h"

using namespace Kdd;
using namespace Kdd::Browser;

namespace
{

constexpr const char* kHostile = "<img src=x onerror=alert(1)>\"'&</script>";

DatasetBuilder image(const char* uid)
{
    return anImage(uid).inStudy("1.2").inSeries("1.3").with(DCM_PatientName, "Doe^Jane");
}

const std::tuple<const char*, Http::Method, int> kRefusals[] = {
    {"/nothing", Http::Method::Get, 404},
    {"/page", Http::Method::Get, 404},
    {"/page/../style.css", Http::Method::Get, 404},
    {"/page/Page.cpp", Http::Method::Get, 404},
    {"/browser", Http::Method::Get, 404},
    {"/browser/studies", Http::Method::Get, 404},
    {"/browser/studies/9.9", Http::Method::Get, 404},
    {"/browser/studies/no-uid", Http::Method::Get, 404},
    {"/browser/studies/1.2/nothing", Http::Method::Get, 404},
    {"/browser/studies/1.2/series", Http::Method::Get, 404},
    {"/browser/studies/1.2/series/9/images", Http::Method::Get, 404},
    {"/browser/studies/1.2/series/1.3/preview", Http::Method::Get, 404},
    {"/browser/studies/1.2/series/1.3/volumes/0/preview", Http::Method::Get, 404},
    {"/browser/studies/1.2/images/1.4", Http::Method::Get, 404},
    {"/browser/studies/1.2/images/1.4/preview", Http::Method::Get, 404},
    {"/browser/studies/1.2/images/9/attributes", Http::Method::Get, 404},
    {"/browser/studies/1.2/difference?a=1.4", Http::Method::Get, 404},
    {"/browser/studies/1.2/difference?a=1.4&b=9", Http::Method::Get, 404},
    {"/browser/studies/1.2", Http::Method::Post, 405},
    {"/browser/studies/1.2", Http::Method::Delete, 405},
    {"/", Http::Method::Options, 204},
};

}  // namespace

TEST_F(BrowserTest, RefusesWhatIsNotThereWithAReasonAndSafely)
{
    write({image("1.4")});
    for (const auto& [target, method, status] : kRefusals) {
        const Http::Response response = get(target, {}, method);
        EXPECT_EQ(response.status, status) << target;
        EXPECT_EQ(bodyOf(response).isEmpty(), status != 404) << target;
        EXPECT_TRUE(headerOf(response, "Content-Security-Policy").contains("default-src 'none'")) << target;
    }
}

TEST_F(BrowserTest, LetsNothingOfAnAnswerBeTakenForAScript)
{
    write({image("1.4")});
    for (const char* target :
         {"/", "/page/app.js", "/browser/config", "/browser/studies/1.2", "/browser/studies/1.2/preview",
          "/browser/studies/1.2/images/1.4/attributes"}) {
        const Http::Response response = get(target);
        const QByteArray policy = headerOf(response, "Content-Security-Policy");
        EXPECT_EQ(response.status, 200) << target;
        EXPECT_FALSE(policy.contains("unsafe") || policy.contains("*")) << policy.constData();
        EXPECT_TRUE(policy.contains("frame-ancestors 'none'")) << policy.constData();
        EXPECT_EQ(headerOf(response, "Referrer-Policy"), "no-referrer") << target;
    }
    EXPECT_FALSE(bodyOf(get("/")).contains("<script>") || bodyOf(get("/")).contains("style="));
}

TEST_F(BrowserTest, GivesHostileValuesAsTextAndAsTheyAre)
{
    write({image("1.4").with(DCM_PatientName, kHostile).with(DCM_ImageComments, "a\nb\x1b\x01")});
    EXPECT_EQ(text("", "attributes/PatientName"), kHostile);
    EXPECT_EQ(textAt(attribute("1.4", "00100010"), "value"), kHostile);
    EXPECT_EQ(textAt(attribute("1.4", "00204000"), "value"), "a\nb\x1b\x01");
    EXPECT_EQ(headerOf(get("/browser/studies/1.2"), "Content-Type"), "application/json");
}

TEST_F(BrowserTest, NamesAnImageWithoutUIDWithoutTellingItsPath)
{
    write({image("1.4").without(DCM_SOPInstanceUID)}, "/secret/place/a.dcm");
    ASSERT_EQ(told("/series/1.3/images", "images").toArray().size(), 1);
    const QByteArray key = told("/series/1.3/images", "images/0/key").toString().toLatin1();
    EXPECT_TRUE(key.startsWith("object-")) << key.constData();
    const QByteArray attributes = "/images/" + key + "/attributes";
    EXPECT_EQ(text(attributes, "key"), key.toStdString());
    for (const QByteArray& below : {attributes, QByteArray(""), QByteArray("/sizes")})
        EXPECT_FALSE(bodyOf(get("/browser/studies/1.2" + below)).contains("secret")) << below.constData();
}

TEST_F(BrowserTest, OpensASeriesWhoseUIDIsNone)
{
    write({image("1.4").inSeries("a/b")});
    const QByteArray key = told("", "series/0/key").toString().toLatin1();
    EXPECT_EQ(told("/series/" + key + "/images", "count"), 1);
}

TEST_F(BrowserTest, SendsThePageCompressedAndOnlyWhenItIsNew)
{
    const Http::Response plain = get("/");
    const Http::Response compressed = get("/", {{"accept-encoding", "gzip, br"}});
    EXPECT_EQ(headerOf(plain, "Content-Encoding"), "");
    EXPECT_EQ(headerOf(compressed, "Content-Encoding"), "gzip");
    EXPECT_EQ(unpacked(bodyOf(compressed)), bodyOf(plain));
    EXPECT_NE(headerOf(plain, "ETag"), headerOf(compressed, "ETag"));
    const Http::Response known = get("/", {{"if-none-match", "\"other\", W/" + headerOf(plain, "ETag")}});
    EXPECT_EQ(known.status, 304);
    EXPECT_TRUE(bodyOf(known).isEmpty());
    EXPECT_EQ(get("/", {{"if-none-match", headerOf(compressed, "ETag")}}).status, 200);
}

TEST_F(BrowserTest, SendsLargeAnswersCompressedUntilAClientHasThem)
{
    QVector<DatasetBuilder> images;
    for (int i = 0; i < 20; ++i)
        images.append(image(("1." + QByteArray::number(100 + i)).constData()));
    write(images);
    const QByteArray target = "/browser/studies/1.2/series/1.3/images";
    const Http::Response plain = get(target);
    const Http::Response compressed = get(target, {{"accept-encoding", "gzip"}});
    EXPECT_EQ(headerOf(compressed, "Content-Encoding"), "gzip");
    EXPECT_EQ(headerOf(plain, "Vary") + headerOf(compressed, "Vary"), "Accept-EncodingAccept-Encoding");
    EXPECT_EQ(unpacked(bodyOf(compressed)), bodyOf(plain));
    const QByteArray tag = headerOf(compressed, "ETag");
    EXPECT_EQ(get(target, {{"accept-encoding", "gzip"}, {"if-none-match", tag}}).status, 304);
    EXPECT_EQ(get(target, {{"if-none-match", tag}}).status, 200);
    images.front().with(DCM_InstanceNumber, "7");
    write(images);
    EXPECT_EQ(get(target, {{"accept-encoding", "gzip"}, {"if-none-match", tag}}).status, 200);
}

TEST_F(BrowserTest, TellsWhatElseTheServerHas)
{
    EXPECT_EQ(json("/browser/config", "dicomWeb"), QLatin1String("pacs/dicom-web"));
    EXPECT_TRUE(json("/browser/config", "viewer").toBool());
}
