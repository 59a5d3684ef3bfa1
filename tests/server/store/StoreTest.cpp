#include "server/ServerFixture.h"
#include "support/FileContent.h"
#include "support/Json.h"
#include "support/Threads.h"

#include <kddlib/QAData.h>
#include <kddlib/StudyChange.h>
#include <kddlib/TagFile.h>

using namespace Kdd;

namespace
{

const QByteArray kType = "multipart/related; type=\"application/dicom\"; boundary=cut";

/// A server that takes objects, over a store of its own.
class StoreTest : public ServerFixture
{
protected:
    StoreTest() { takeObjects(); }

    static QByteArray partOf(const QByteArray& object, const QByteArray& type = "application/dicom")
    {
        return "--cut\r\nContent-Type: " + type + "\r\n\r\n" + object + "\r\n";
    }

    Reply post(const QByteArray& body, const QByteArray& path = "/studies", const QByteArray& type = kType,
               const QByteArray& headers = {}) const
    {
        return ask("POST", "/dicom-web" + path, "Content-Type: " + type + "\r\n" + headers, body);
    }

    Reply store(const DatasetBuilder& image, const QByteArray& path = "/studies") const
    {
        return post(partOf(image.file()) + "--cut--", path);
    }

    /// Two servers over the one store, of which one stores an object and the other is asked.
    void onTwoServers(const std::function<void(int number, const QByteArray& instance)>& ask)
    {
        start();
        std::unique_ptr<Server> other = std::move(mServer);
        start();
        for (int i = 1; i <= 6; ++i) {
            other.swap(mServer);
            const QByteArray uid = "1.2.3." + QByteArray::number(i);
            ASSERT_EQ(store(anImage(uid)).status, 200);
            other.swap(mServer);
            ask(i, "/dicom-web/studies/1.2/series/1.2.3/instances/" + uid);
        }
    }

    /// "1.2.3.1" for each that is stored, "1.2.3.1:0111" for one that is not, ":C000" for one without name.
    static std::string told(const Reply& reply)
    {
        QString line = QString::number(reply.status);
        for (const char* sequence : {"00081199/Value", "00081198/Value", "0008119A/Value"}) {
            for (const QJsonValue& item : jsonAt(reply.body, sequence).toArray()) {
                line += QLatin1Char(' ') + jsonAt(item, "00081155/Value/0").toString();
                if (const int reason = jsonAt(item, "00081197/Value/0").toInt(); reason != 0)
                    line += QStringLiteral(":%1").arg(reason, 4, 16, QLatin1Char('0')).toUpper();
            }
        }
        return line.toStdString();
    }
};

TEST_F(StoreTest, WhatIsToldStoredIsFoundAndRetrievedAtOnce)
{
    start();
    for (int i = 1; i <= 5; ++i) {
        const QByteArray uid = "1.2.3." + QByteArray::number(i);
        const QByteArray object = anImage(uid).with(DCM_PatientName, "Doe^J").file();
        const Reply reply = post(partOf(object) + "--cut--");
        EXPECT_EQ(told(reply), "200 " + uid.toStdString());
        EXPECT_EQ(reply.header("Content-Type"), "application/dicom+json");
        const QByteArray path = "/studies/1.2/series/1.2.3/instances/" + uid;
        const QByteArray images = "\"images\":" + QByteArray::number(i) + ',';
        EXPECT_TRUE(i % 2 == 0 || ask("GET", "/browser/studies/1.2").body.contains(images));
        EXPECT_TRUE(reply.body.contains("/dicom-web" + path + '"')) << reply.body.constData();
        EXPECT_EQ(get(path + "?accept=application/dicom;transfer-syntax=*").status, 200);
        EXPECT_EQ(instances("1.2"), i);
        EXPECT_EQ(get(path + "/metadata").status, 200);
    }
    EXPECT_TRUE(get("/studies?PatientName=doe*").body.contains("\"1.2\""));
    EXPECT_EQ(storedFiles().size(), 5);
}

TEST_F(StoreTest, WhatOneServerStoredAnotherOneFindsAtOnce)
{
    onTwoServers([this](int number, const QByteArray& instance) {
        // Each way of asking, with nothing asked before that would have brought it in.
        if (number % 3 == 2)
            EXPECT_EQ(instances("1.2"), number);
        else
            EXPECT_EQ(ask("GET", instance + (number % 3 == 0 ? "" : "/metadata")).status, 200);
    });
}

TEST_F(StoreTest, ATagFileThatIsNoGoodIsMadeAnewWithWhatAnotherOneTook)
{
    onTwoServers([this](int number, const QByteArray& instance) {
        const QString tagFile = TagFile::cacheFilePathForStudy("1.2");
        if (number % 2 == 0)
            QFile::remove(tagFile);
        else
            putFile(tagFile, "no tag file");
        const QByteArray ways[] = {instance, instance + "/metadata", "/browser/studies/1.2"};
        EXPECT_EQ(ask("GET", ways[number % 3]).status, 200) << ways[number % 3].constData();
        EXPECT_EQ(instances("1.2"), number);
    });
}

TEST_F(StoreTest, TellsNothingIncompleteOfAStudyThatAnotherOneWorksOn)
{
    std::unique_ptr<Kxg::StudyClaim> claim;
    start();
    ASSERT_EQ(store(anImage("1.2.3.1")).status, 200);
    ASSERT_EQ(instances("1.2"), 1);
    const auto database = catalogue();
    ASSERT_TRUE(database->claim("1.2", 5000, claim).good() && claim != nullptr);
    ASSERT_EQ(store(anImage("1.2.3.2")).status, 200);
    const Reply held = get("/studies/1.2/instances?SOPInstanceUID=1.2.3.2");
    EXPECT_EQ(held.status, 503);
    EXPECT_EQ(held.header("Retry-After"), "1");
    EXPECT_EQ(get("/studies?StudyInstanceUID=1.2").status, 200) << "it is known";
    // Nor when it is tried, and in vain.
    const QString object = mStore.filePath("objects/1.2/1.2.3/1.2.3.2.dcm");
    ASSERT_TRUE(QFile::rename(object, mStore.filePath("away")));
    start();
    claim.reset();
    EXPECT_EQ(get("/studies/1.2/instances?SOPInstanceUID=1.2.3.2").status, 503);
    EXPECT_EQ(get("/studies/1.2/instances?SOPInstanceUID=1.2.3.9").body, "[]");
    EXPECT_EQ(get("/studies/1.2/instances?SOPInstanceUID=1.2.3.1&Modality=SR").body, "[]");
    ASSERT_TRUE(QFile::rename(mStore.filePath("away"), object));
    EXPECT_EQ(instances("1.2"), 2);
}

TEST_F(StoreTest, TellsOfEachPartWhatBecameOfIt)
{
    start();
    const QByteArray good = anImage("1.2.3.1").file();
    QByteArray mismatch = good;
    mismatch.replace(mismatch.indexOf("1.2.3.1"), 7, "1.2.3.9");  // in the meta information
    QByteArray cut = anImage("1.2.3.2").words(std::vector<Uint16>(500, 7)).file();
    cut.chop(600);
    const QByteArray body = partOf(good) + partOf("no DICOM") + partOf("") + partOf(mismatch) + partOf(cut) +
                            partOf(anImage("../../x").file()) +
                            partOf(anImage("1.2.3.3").inStudy("").file()) + partOf(good, "application/json") +
                            partOf(anImage("1.2.3.4").file()) + "--cut--";
    const Reply reply = post(body);
    EXPECT_EQ(told(reply),
              "202 1.2.3.1 1.2.3.4 1.2.3.1:A900 1.2.3.2:C000 1.2.3.3:C000 :C000 :C000 :C000 :C000")
        << reply.body.constData();
    EXPECT_EQ(instances("1.2"), 2);
    EXPECT_EQ(storedFiles().size(), 2);
    EXPECT_EQ(told(post(partOf("no DICOM") + "--cut--")), "409 :C000");
    const std::string longest = "1." + std::string(62, '9');
    EXPECT_EQ(told(store(anImage(longest.c_str()), "/studies/1.2")), "200 " + longest);
    EXPECT_EQ(told(store(anImage((longest + '9').c_str()), "/studies/1.2")).substr(0, 4), "409 ");
    EXPECT_EQ(told(store(anImage("1.2.3.5"), "/studies/1.9")), "409 1.2.3.5:C001");
    EXPECT_EQ(told(store(anImage("1.2.3.5"), "/studies/1.2")), "200 1.2.3.5");
}

TEST_F(StoreTest, TakesAnObjectOnceHoweverOftenItComes)
{
    start();
    const QByteArray object = anImage("1.2.3.1").file();
    onThreads(8, [&](int) { EXPECT_EQ(told(post(partOf(object) + "--cut--")), "200 1.2.3.1"); });
    // Another sender writes meta information of its own.
    QByteArray sentOn = object;
    sentOn[5] = 'x';
    EXPECT_EQ(told(post(sentOn, "/studies", "application/dicom")), "200 1.2.3.1");
    EXPECT_EQ(instances("1.2"), 1);
    EXPECT_EQ(storedFiles().size(), 1);
}

TEST_F(StoreTest, FollowsTheRuleForOtherContentOfTheSameUid)
{
    start();
    EXPECT_EQ(told(store(anImage("1.2.3.1").with(DCM_PatientName, "First"))), "200 1.2.3.1");
    EXPECT_EQ(told(store(anImage("1.2.3.1").with(DCM_PatientName, "Second"))), "409 1.2.3.1:0111");
    EXPECT_TRUE(get("/studies/1.2/metadata").body.contains("First"));
    mSettings.objects->sameUid = SameUid::Replace;
    start();
    EXPECT_EQ(told(store(anImage("1.2.3.1").with(DCM_PatientName, "Second"))), "200 1.2.3.1");
    EXPECT_TRUE(get("/studies/1.2/metadata").body.contains("Second"));
    EXPECT_EQ(storedFiles().size(), 2) << "what was there stays";
    EXPECT_EQ(told(store(anImage("1.2.3.1").with(DCM_PatientName, "First"))), "200 1.2.3.1");
    EXPECT_TRUE(get("/studies/1.2/metadata").body.contains("First"));
    EXPECT_EQ(storedFiles().size(), 2);
    EXPECT_EQ(instances("1.2"), 1);
}

TEST_F(StoreTest, LeadsWhatComesAgainToWhereItWasMoved)
{
    start();
    store(anImage("1.2.3.1"));
    store(anImage("1.2.3.2"));
    ASSERT_EQ(instances("1.2"), 2);
    QAData job;
    job.studyUID = "1.5";
    job.oldStudyUID = "1.2";
    job.images = {"1.2.3.1"};
    job.substitutions = {{DCM_StudyInstanceUID, QStringLiteral("1.5")}};
    ASSERT_TRUE(StudyChange::correct(job).good());
    for (const char* name : {"", "Other"}) {
        mSettings.objects->sameUid = SameUid::Replace;
        start();
        const Reply again = store(anImage("1.2.3.1").with(DCM_PatientName, name));
        EXPECT_EQ(told(again), "200 1.2.3.1");
        EXPECT_TRUE(again.body.contains("/studies/1.5/series/")) << again.body.constData();
        EXPECT_EQ(instances("1.2"), 1);
        EXPECT_EQ(instances("1.5"), 1);
    }
}

TEST_F(StoreTest, TakesBackWhatWasRemoved)
{
    start();
    store(anImage("1.2.3.1"));
    ASSERT_EQ(instances("1.2"), 1);
    ASSERT_TRUE(StudyChange(*catalogue()).remove({"1.2", {}, {}}).good());
    EXPECT_EQ(instances("1.2"), 0);
    EXPECT_EQ(told(store(anImage("1.2.3.1").with(DCM_PatientName, "Other"))), "200 1.2.3.1");
    EXPECT_EQ(instances("1.2"), 1);
    EXPECT_TRUE(get("/studies/1.2/metadata").body.contains("Other"));
}

TEST_F(StoreTest, AnswersWhatItCannotTakeBeforeItComes)
{
    mSettings.store.requestBytes = 100000;
    mSettings.store.parts = 3;
    mSettings.objects->objectBytes = 50000;
    start();
    const QByteArray part = partOf(anImage("1.2.3.1").file());
    const QByteArray boundary(201, 'b');
    const std::pair<QByteArray, int> kTypes[] = {
        {"multipart/form-data; boundary=cut", 415},
        {"multipart/related; type=\"application/dicom+json\"; boundary=cut", 415},
        {"multipart/related; type=\"application/dicom\"", 400},
        {"multipart/related; boundary=" + boundary, 400},
    };
    for (const auto& [type, status] : kTypes)
        EXPECT_EQ(post(QByteArray(part).replace("cut", boundary), "/studies", type).status, status)
            << type.constData();
    EXPECT_EQ(post(part, "/studies", kType, "Accept: text/html\r\n").status, 406);
    EXPECT_EQ(post(part, "/studies/1.2/series").status, 405);
    const QByteArray large = partOf(QByteArray(60000, 'x'));
    const std::tuple<const char*, QByteArray, const char*> kBodies[] = {
        {"no part", "nothing of it", "400"},
        {"not even a part", QByteArray(120000, 'x'), "400"},
        {"the end is missing", part + part.left(part.size() - 20), "202 1.2.3.1 :C000"},
        {"nothing tells that it is whole", part, "400 :C000"},
        {"large object", large + "--cut--", "409 :A700"},
        {"large body", partOf(QByteArray(49000, 'x')) + large + "--cut--", "413 :C000 :A700"},
        {"many parts", part.repeated(4) + "--cut--", "202 1.2.3.1 1.2.3.1 1.2.3.1"},
    };
    for (const auto& [name, body, answer] : kBodies)
        EXPECT_EQ(told(post(body)), answer) << name;
    mSettings.objects->freeBytes = qint64(1) << 60;
    start();
    const Reply full = post(part);
    EXPECT_EQ(full.status, 503);
    EXPECT_EQ(full.header("Retry-After"), "60");
}

TEST_F(StoreTest, TellsInXmlToWhomWantsThat)
{
    start();
    const Reply reply = post(partOf(anImage("1.2.3.1").file()) + "--cut--", "/studies", kType,
                             "Accept: application/dicom+xml\r\n");
    EXPECT_EQ(reply.header("Content-Type"), "application/dicom+xml");
    EXPECT_TRUE(
        reply.body.contains("<DicomAttribute tag=\"00081199\" vr=\"SQ\" keyword=\"ReferencedSOPSequence\">"
                            "<Item number=\"1\">"))
        << reply.body.constData();
    EXPECT_TRUE(reply.body.contains("<Value number=\"1\">1.2.3.1</Value>"));
}

TEST_F(StoreTest, TakesNothingFromPagesOfOtherOrigins)
{
    start();
    const QByteArray body = partOf(anImage("1.2.3.1").file()) + "--cut--";
    for (const char* headers :
         {"Origin: https://evil.example\r\n", "Origin: null\r\n", "Origin: http://localhost:1\r\n",
          "Origin: https://localhost\r\n", "Sec-Fetch-Site: cross-site\r\n", "Sec-Fetch-Site: same-site\r\n",
          "Origin: https://evil.example\r\nSec-Fetch-Site: same-origin\r\n"})
        EXPECT_EQ(post(body, "/studies", kType, headers).status, 403) << headers;
    // All that a browser sends for a page without asking beforehand.
    for (const char* type :
         {"text/plain", "multipart/form-data; boundary=cut", "application/x-www-form-urlencoded", ""})
        EXPECT_EQ(post(body, "/studies", type).status, 415) << type;
    EXPECT_EQ(instances("1.2"), 0);
    EXPECT_EQ(storedFiles().size(), 0);
    EXPECT_EQ(told(post(body, "/studies", kType, "Origin: http://localhost\r\n")), "200 1.2.3.1");
}

TEST_F(StoreTest, TakesNothingUnlessItIsToldTo)
{
    mSettings.objects.reset();
    start();
    EXPECT_EQ(store(anImage("1.2.3.1")).status, 405);
}

TEST_F(StoreTest, TellsTheTrailWhichStudiesItChanged)
{
    mSettings.access = Access::AccessRules::open();
    mSettings.access->audit = mStore.filePath("audit.jsonl").toUtf8();
    start();
    const QByteArray parts = partOf(anImage("1.2.3.1").file()) + partOf(anImage("5.1").inStudy("5").file()) +
                             partOf(anImage("1.2.3.2").file()) + partOf("Doe^John");
    EXPECT_EQ(post(parts + "--cut--").status, 202);
    EXPECT_EQ(store(anImage("1.2.3.1")).status, 200);
    mServer.reset();
    const QByteArray trail = fileContent(mStore.filePath("audit.jsonl"));
    EXPECT_EQ(trail.count('\n'), 2);
    EXPECT_EQ(trail.count(R"("studies":["1.2","5"])"), 1) << trail.constData();
    EXPECT_EQ(trail.count("studies\":"), 1) << "the second changed nothing";
    EXPECT_FALSE(trail.contains("Doe"));
}

}  // namespace
