#include "server/change/ChangedArchive.h"

#include <gmock/gmock.h>
#include <kddlib/Catalogue.h>

using namespace Kdd;

namespace
{

const QByteArray kRename = R"({"timestamp":"20240131120000","login":"anna",)"
                           R"("tags":[{"tag":"00100010","value":"Roe^Jane"}]})";
const char* const kRenameXml =
    "<Job><Timestamp>20240131120000</Timestamp><Login>anna</Login><Substitutions>"
    "<Tag Group='0010' Element='0010'><Value>Roe^Jane</Value></Tag></Substitutions></Job>";

using ChangeTest = ChangedArchive;

TEST_F(ChangeTest, ShowsACorrectionInEveryAnswerAtOnce)
{
    start();
    storeStudy();
    const QByteArray tag = get("/studies/1.2/metadata").header("ETag");
    ASSERT_FALSE(tag.isEmpty());
    const Reply reply = correct("1.2", "?all=true", kRename);
    ASSERT_EQ(reply.status, 200) << reply.body.constData();
    EXPECT_EQ(
        QString::fromUtf8(reply.body).replace(QString::fromUtf8(mServer->address()), QString()),
        QString::fromUtf8(
            R"({"changed":3,"changes":[{"attributes":[{"keyword":"PatientName","new":"Roe^Jane",)"
            R"("old":"Doe^John","tag":"00100010"}],"count":3,"images":["1.2.3.1","1.2.3.2","1.2.4.1"]}],)"
            R"("complete":true,"images":3,"moved":0,"notFound":[],"pending":false,"preview":false,"study":"1.2",)"
            R"("url":"http://localhost/dicom-web/studies/1.2"})"));
    EXPECT_EQ(get("/studies/1.2/metadata", "If-None-Match: " + tag + "\r\n").status, 200);
    EXPECT_EQ(values("1.2", "00100010"), "Roe^Jane Roe^Jane Roe^Jane");
    EXPECT_TRUE(get("/studies?PatientName=roe*").body.contains("\"1.2\""));
    EXPECT_FALSE(get("/studies?PatientName=doe*").body.contains("\"1.2\""));
    const QByteArray image = "/studies/1.2/series/1.2.3/instances/1.2.3.1";
    EXPECT_TRUE(get(image + "?accept=application/dicom").body.contains("Roe^Jane"));
    EXPECT_TRUE(ask("GET", "/browser/studies/1.2").body.contains("Roe^Jane"));
    EXPECT_THAT(feed("1.2"), testing::EndsWith("corrected"));
}

/// What is sent, its type and body, and what it is answered with: the status and a part of the reason.
const std::tuple<const char*, const char*, QByteArray, int, const char*> kRefused[] = {
    {"", "application/json", kRename, 400, "which images are meant"},
    {"?all=true", "application/x-www-form-urlencoded", kRename, 415, "application/json"},
    {"?all=true", "text/plain", kRename, 415, ""},
    {"?all=true", "", kRename, 415, ""},
    {"?all=true&accept=text/html", "application/json", kRename, 406, ""},
    {"?all=true&preveiw=true", "application/json", kRename, 400, "no parameter \"preveiw\""},
    {"?all=true&preview=1", "application/json", kRename, 400, "true or false"},
    {"?all=true&preview=true&preview=false", "application/json", kRename, 400, "true or false"},
    {"?image=1.2.3.1,", "application/json", kRename, 400, "lists of UIDs"},
    {"?all=true", "application/xml", kRename, 400, "Line 1"},
    {"?all=true", "application/json", kRenameXml, 400, "no JSON object"},
    {"?all=true", "application/json", QByteArray(1024 * 1024 + 1, ' '), 413, "1048576"},
    {"?image=1.2.3.9", "application/json", kRename, 404, R"("notFound":["1.2.3.9"])"},
    {"?all=true", "application/xml", "<Job><Substitutions OldSUID='../1.2'/></Job>", 400, "no UID"},
    {"?series=1.2.9", "application/json", kRename, 404, R"("notFound":["1.2.9"])"},
    {"?all=true", "application/json", R"({"tags":[{"tag":"00100030","value":"soon"}]})", 409,
     ": Tag (0010,0030): \"soon\" is no date"},
    {"?all=true", "application/json", R"({"tags":[{"tag":"00020010","value":"1.2"}]})", 409, "(0002,0010)"},
    {"?all=true", "application/json", R"({"oldStudy":"1.7","tags":[]})", 404, R"("images":0)"},
};

TEST_F(ChangeTest, RefusesWhatCannotBeDoneAndSaysWhy)
{
    start();
    storeStudy();
    const QByteArray before = get("/studies/1.2/metadata").body;
    for (const auto& [query, type, body, status, reason] : kRefused) {
        const Reply reply = ask("POST", QByteArray("/dicom-web/studies/1.2/corrections") + query, type, body);
        EXPECT_EQ(reply.status, status) << query << ' ' << body.left(80).constData();
        EXPECT_THAT(reply.body.toStdString(), testing::HasSubstr(reason)) << query;
        EXPECT_FALSE(reply.body.contains(mStore.folder().toUtf8()));
    }
    EXPECT_EQ(get("/studies/1.2/metadata").body, before);
    EXPECT_EQ(correct("1.9", "?all=true", kRename).status, 404);
    EXPECT_EQ(correct("1.2", "?image=1.2.3.1&image=1.2.9", kRename).status, 200) << "one is there";
    EXPECT_THAT(feed("1.2"), testing::EndsWith("corrected"));
}

TEST_F(ChangeTest, TakesTheSameJobAsXmlAndAsJson)
{
    start();
    storeStudy();
    const QByteArray path = "/dicom-web/studies/1.2/corrections?series=1.2.3&preview=true";
    const QByteArray told = ask("POST", path, "application/json", kRename).body;
    EXPECT_THAT(told.toStdString(), testing::HasSubstr(R"("changed":2)"));
    EXPECT_EQ(ask("POST", path, "text/xml; charset=utf-8", kRenameXml).body, told);
    EXPECT_EQ(ask("POST", path, "application/xml", kRenameXml).body, told);
}

/// Jobs for the study 1.2, each of which is followed by the next one.
const char* const kJobs[] = {
    R"({"images":["1.2.3.1","1.2.3.8"],"tags":[{"tag":"00100020","value":"8"},{"tag":"00080060","value":"CT"}]})",
    R"({"images":["1.2.3.1"],"tags":[{"tag":"00080018","value":"1.2.3.7"}]})",
    R"({"images":["1.2.3.7"],"tags":[{"tag":"00080018","value":"1.2.3.2"}]})",  // another has it
    R"({"series":["1.2.4"],"tags":[{"tag":"0020000E","value":"1.2.3"}]})",
    R"({"series":["1.2.3"],"tags":[{"tag":"0020000D","value":"1.5"}]})",
    R"({"wholeStudy":true,"tags":[{"tag":"00100010","value":""}]})",  // none is left
    R"({"oldStudy":"1.5","wholeStudy":true,"tags":[{"tag":"0020000D","value":"1.2"},{"tag":"7FE00010"}]})",
};

TEST_F(ChangeTest, PreviewTellsWhatIsThenDoneAndDoesNothing)
{
    start();
    storeStudy();
    const auto files = [this] { return filesBelow(mStore.folder(), {QStringLiteral("*.tc*")}); };
    for (const char* job : kJobs) {
        const Reply shown = get("/studies/1.2/metadata");
        const std::string fed = feed("1.2");
        const QStringList before = files();
        const Reply preview = correct("1.2", "?preview=true", job);
        EXPECT_EQ(get("/studies/1.2/metadata").header("ETag"), shown.header("ETag"));
        EXPECT_EQ(feed("1.2"), fed);
        EXPECT_EQ(files(), before);
        const Reply done = correct("1.2", "", job);
        EXPECT_EQ(done.status, preview.status);
        EXPECT_EQ(done.body.toStdString(),
                  QByteArray(preview.body).replace("\"preview\":true", "\"preview\":false").toStdString());
    }
    EXPECT_EQ(values("1.2", "00080018"), "1.2.3.2 1.2.3.7 1.2.4.1");
}

TEST_F(ChangeTest, MovesImagesAndNamesTheNewStudy)
{
    start();
    storeStudy();
    const Reply reply = correct("1.2", "?series=1.2.3", R"({"tags":[{"tag":"0020000D","value":"1.5"}]})");
    ASSERT_EQ(reply.status, 200) << reply.body.constData();
    EXPECT_EQ(textAt(reply.body, "study"), "1.5");
    EXPECT_EQ(textAt(reply.body, "oldStudy"), "1.2");
    EXPECT_EQ(textAt(reply.body, "moved"), "2");
    EXPECT_THAT(textAt(reply.body, "url"), testing::EndsWith("/studies/1.5"));
    EXPECT_EQ(values("1.2", "00080018"), "1.2.4.1");
    EXPECT_EQ(values("1.5", "00080018"), "1.2.3.1 1.2.3.2");
    EXPECT_EQ(get("/studies/1.2/series/1.2.3/metadata").status, 404);
    EXPECT_THAT(feed("1.5"), testing::HasSubstr("moved"));
    // Sent to the study that gets them, it says where they come from.
    EXPECT_EQ(
        correct("1.2", "?all=true", R"({"oldStudy":"1.5","tags":[{"tag":"0020000D","value":"1.2"}]})").status,
        200);
    EXPECT_EQ(values("1.2", "00080018"), "1.2.3.1 1.2.3.2 1.2.4.1");
    EXPECT_EQ(get("/studies/1.5/metadata").status, 404);
}

TEST_F(ChangeTest, RemovesWhatIsNamedAndTellsHowMuch)
{
    start();
    storeStudy();
    EXPECT_EQ(remove("/studies/1.2/series/1.2.3/instances/1.2.4.1").status, 404) << "not in that series";
    EXPECT_EQ(remove("/studies/1.2?preview=true").status, 400);
    EXPECT_EQ(remove("/studies").status, 405);
    EXPECT_EQ(remove("/studies/1.2/metadata").status, 405);
    EXPECT_EQ(remove("/studies/1.9").status, 404);
    const Reply image = remove("/studies/1.2/series/1.2.3/instances/1.2.3.1");
    EXPECT_EQ(image.status, 200);
    EXPECT_EQ(image.body.toStdString(), R"({"study":"1.2","images":1,"pending":false})");
    EXPECT_EQ(values("1.2", "00080018"), "1.2.3.2 1.2.4.1");
    EXPECT_EQ(get("/studies/1.2/series/1.2.3/instances/1.2.3.1").status, 404);
    EXPECT_EQ(remove("/studies/1.2/series/1.2.3/instances/1.2.3.1").status, 404) << "again";
    EXPECT_EQ(remove("/studies/1.2/series/1.2.4").body.toStdString(),
              R"({"study":"1.2","images":1,"pending":false})");
    EXPECT_EQ(values("1.2", "00080018"), "1.2.3.2");
    EXPECT_EQ(remove("/studies/1.2").status, 200);
    EXPECT_EQ(get("/studies/1.2/metadata").status, 404);
    EXPECT_EQ(get("/studies?StudyInstanceUID=1.2").body.toStdString(), "[]");
    EXPECT_THAT(feed("1.2"), testing::EndsWith("deleted"));
}

TEST_F(ChangeTest, DoesNothingUnlessItIsToldTo)
{
    start();
    storeStudy();
    mSettings.changes.corrections = false;
    mSettings.changes.deletions = false;
    start();
    EXPECT_EQ(correct("1.2", "?all=true", kRename).status, 405);
    EXPECT_EQ(correct("1.2", "?all=true&preview=true", kRename).status, 405);
    const Reply refused = remove("/studies/1.2");
    EXPECT_EQ(refused.status, 405);
    EXPECT_EQ(refused.header("Allow"), "GET, HEAD, OPTIONS, POST");
    EXPECT_EQ(get("/studies/1.2/corrections").status, 200);
    EXPECT_EQ(values("1.2", "00100010"), "Doe^John Doe^John Doe^John");
    EXPECT_THAT(ask("GET", "/browser/config").body.toStdString(), testing::HasSubstr(R"("may":["store"])"));
}

TEST_F(ChangeTest, NamesWhoIsKnownAndNotWhomTheJobNames)
{
    mSettings.access.emplace();
    mSettings.access->anyone = Access::Right::Read | Access::Rights(Access::Right::Store);
    mSettings.access->header =
        Access::HeaderRules{"x-user", {"127.0.0.1"}, {{"*", Access::Right::Correct}, {"eve", {}}}};
    mSettings.access->audit = mStore.filePath("audit.jsonl").toUtf8();
    start();
    storeStudy();
    EXPECT_EQ(ask("DELETE", "/dicom-web/studies/1.2", {}, {}, "X-User: berta\r\n").status, 403);
    for (const char* headers : {"", "X-User: berta\r\nOrigin: https://evil.example\r\n",
                                "X-User: berta\r\nSec-Fetch-Site: cross-site\r\n"})
        EXPECT_EQ(correct("1.2", "?all=true", kRename, headers).status, 403) << headers;
    const QByteArray who = "J\xc3\xbcrg \xd0\x96";
    EXPECT_EQ(correct("1.2", "?series=1.2.3", kRename, "X-User: " + who + "\r\n").status, 200);
    const QByteArray history = get("/studies/1.2/corrections").body;
    EXPECT_TRUE(history.contains("\"who\":\"J\xc3\xbcrg \\\\u0416\"")) << history.constData();
    EXPECT_FALSE(history.contains("anna"));
    mServer.reset();
    const QByteArray trail = fileContent(mStore.filePath("audit.jsonl"));
    EXPECT_THAT(trail.toStdString(), testing::HasSubstr(R"("images":2,)"));
    EXPECT_FALSE(trail.contains("Roe") || trail.contains("Doe") || trail.contains("anna"));
}

TEST_F(ChangeTest, TellsInTheTrailWhichStudiesAndHowManyImages)
{
    mSettings.access = Access::AccessRules::open();
    mSettings.access->audit = mStore.filePath("audit.jsonl").toUtf8();
    start();
    storeStudy();
    correct("1.2", "?series=1.2.3", R"({"tags":[{"tag":"0020000D","value":"1.5"}]})");
    correct("1.5", "?all=true&preview=true", kRename);
    remove("/studies/1.5");
    mServer.reset();
    QStringList lines;
    for (const QByteArray& line : fileContent(mStore.filePath("audit.jsonl")).split('\n')) {
        QStringList studies = jsonAt(line, "studies").toVariant().toStringList();
        studies.sort();
        if (!studies.isEmpty())
            lines << jsonAt(line, "method").toString() + QLatin1Char(' ') + studies.join(QLatin1Char(',')) +
                         QLatin1Char(' ') + jsonAt(line, "images").toVariant().toString();
    }
    // Requests over several connections have their lines when their answers are gone, in whatever order.
    lines.sort();
    EXPECT_EQ(lines.join(QLatin1Char(';')).toStdString(),
              "DELETE 1.5 2;POST 1.2 1;POST 1.2 1;POST 1.2 1;POST 1.2,1.5 2;POST 1.5 ");
}

TEST_F(ChangeTest, TellsWhoeverComesWhileOthersWorkOnTheStudy)
{
    mSettings.changes.patience = std::chrono::milliseconds(0);
    start();
    storeStudy();
    ASSERT_EQ(values("1.2", "00080018"), "1.2.3.1 1.2.3.2 1.2.4.1");
    const auto database = catalogue();
    std::unique_ptr<Kxg::StudyClaim> claim;
    ASSERT_TRUE(database->claim("1.2", 0, claim).good() && claim != nullptr);
    for (const Reply& reply : {correct("1.2", "?all=true", kRename), remove("/studies/1.2")}) {
        EXPECT_EQ(reply.status, 503);
        EXPECT_EQ(reply.header("Retry-After"), "10");
    }
    EXPECT_EQ(correct("1.2", "?all=true&preview=true", kRename).status, 200)
        << "that takes nothing from anybody";
    claim.reset();
    EXPECT_EQ(correct("1.2", "?all=true", kRename).status, 200);
}

}  // namespace
