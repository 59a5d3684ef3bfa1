#include "server/change/ChangedArchive.h"
#include "server/dicomweb/change/CorrectionBody.h"
#include "server/dicomweb/change/CorrectionHistory.h"

#include <kddlib/QAAudit.h>
#include <kddlib/TagFile.h>
#include <kddlib/TagMap.h>

using namespace Kdd;
using namespace Kdd::DicomWeb;

namespace
{

using HistoryTest = ChangedArchive;

TEST_F(HistoryTest, TellsEachChangeOfEachImage)
{
    start();
    storeStudy();
    correct("1.2", "?image=1.2.3.1",
            R"({"timestamp":"20240131000501","login":"anna","tags":[{"tag":"00100010","value":"=1+1"},)"
            R"({"tag":"00081030","value":"a \"b\", c"}]})");
    correct("1.2", "?image=1.2.3.1",
            R"({"timestamp":"20240201130000","tags":[{"tag":"00100010","value":"'x"}]})");
    const Reply csv = get("/studies/1.2/corrections", "Accept: text/csv\r\n");
    EXPECT_EQ(csv.header("Content-Type"), "text/csv; charset=utf-8; header=present");
    EXPECT_EQ(csv.header("Content-Disposition"), "attachment; filename=\"corrections-1.2.csv\"");
    const std::string before = R"("1.2","1.2.3","1.2.3.1",)";
    EXPECT_EQ(csv.body.toStdString(),
              "\"study\",\"series\",\"image\",\"time\",\"who\",\"tag\",\"keyword\",\"old\",\"new\"\r\n" +
                  before + R"("2024-01-31T00:05:01","anna","00100010","PatientName","Doe^John","'=1+1")" +
                  "\r\n" + before +
                  R"("2024-01-31T00:05:01","anna","00081030","StudyDescription","","a ""b"", c")" + "\r\n" +
                  before + R"("2024-02-01T13:00:00","","00100010","PatientName","'=1+1","''x")" + "\r\n");
    const Reply json = get("/studies/1.2/corrections");
    ASSERT_EQ(jsonAt(json.body, "corrections").toArray().size(), 2);
    EXPECT_EQ(jsonAt(json.body, "corrections/1"),
              jsonAt(R"({"changes":[{"keyword":"PatientName","new":"'x","old":"=1+1","tag":"00100010"}],)"
                     R"("image":"1.2.3.1","series":"1.2.3","time":"2024-02-01T13:00:00","who":""})"));
    const QByteArray known = "If-None-Match: " + json.header("ETag") + "\r\n";
    EXPECT_EQ(get("/studies/1.2/corrections", known).status, 304);
    EXPECT_EQ(get("/studies/1.2/corrections?accept=text/csv", known).status, 200) << "another form";
    EXPECT_EQ(get("/studies/1.2/corrections?accept=text/html").status, 406);
    EXPECT_EQ(get("/studies/1.9/corrections").status, 404);
}

/// More than one block of it.
TEST_F(HistoryTest, TellsOfManyImagesAndOfLogsThatCannotBeRead)
{
    TagFile file;
    AuditLog log;
    log.append({QStringLiteral("31/1/2024 12:00:00 PM anna"),
                {{DCM_PatientName, QString(400, QLatin1Char('x')), QStringLiteral("B")}}});
    AuditLog broken;
    broken.append({QStringLiteral("no time"), {}});
    for (int i = 0; i < 500; ++i) {
        std::unique_ptr<TagMap> map(anImage(QByteArray("1.2.3." + QByteArray::number(1000 + i))).map());
        ASSERT_TRUE((i == 400 ? broken : log).store(*map));
        if (i == 300)
            map->putAndInsertString(AuditLog::keysIn(*map).first(), "no base64!");
        ASSERT_NE(file.addTagMap(map.release(), nullptr, true), nullptr);
    }
    ASSERT_TRUE(file.writeCacheFile());
    start();
    const QByteArray told = get("/studies/1.2/corrections").body;
    ASSERT_EQ(jsonAt(told, "corrections").toArray().size(), 499);
    EXPECT_EQ(textAt(told, "corrections/399/time"), "no time");
    EXPECT_EQ(jsonAt(told, "unreadable"), QJsonArray{QStringLiteral("1.2.3.1300")});
    const QByteArray csv = get("/studies/1.2/corrections?accept=text/csv").body;
    EXPECT_EQ(csv.count("\r\n"), 1 + 498 + 1) << "one of them changed nothing";
    EXPECT_TRUE(csv.contains("\"1.2.3.1300\",\"\",\"\",\"\",\"the audit log cannot be read\""));
}

const std::pair<const char*, const char*> kFields[] = {
    {"", R"("")"},
    {"Doe^John", R"("Doe^John")"},
    {"a\"b", R"("a""b")"},
    {"a\r\nb,c", "\"a\r\nb,c\""},
    {"=1+1", R"("'=1+1")"},
    {"+1", R"("'+1")"},
    {"-1", R"("'-1")"},
    {"@SUM(A1)", "\"'@SUM(A1)\""},
    {" \t=1+1", "\"' \t=1+1\""},
    {"\tx", "\"'\tx\""},
    {"\nx", "\"'\nx\""},
    {"\xef\xbc\x9d"
     "1",
     "\"'\xef\xbc\x9d"
     "1\""},
    {"'x", R"("''x")"},
    {"a=1", R"("a=1")"},
};

TEST(CsvField, IsAFormulaForNoSpreadsheet)
{
    for (const auto& [value, field] : kFields)
        EXPECT_EQ(csvField(QString::fromUtf8(value)).toStdString(), field);
}

const std::array<const char*, 3> kTimes[] = {
    {{"31/1/2024 12:00:00 PM anna b", "2024-01-31T12:00:00", "anna b"}},
    {{"1/12/2024 12:05:00 AM", "2024-12-01T00:05:00", ""}},
    {{"1/12/2024 1:05:00 PM ", "2024-12-01T13:05:00", ""}},
    {{"31/2/2024 1:05:00 PM anna", "31/2/2024 1:05:00 PM anna", ""}},
    {{"anna", "anna", ""}},
};

TEST(CorrectionTime, IsTakenApartWhereItIsOne)
{
    for (const auto& [logged, moment, who] : kTimes) {
        const CorrectionTime time = CorrectionTime::of(QString::fromLatin1(logged));
        EXPECT_EQ(time.moment.toStdString(), moment);
        EXPECT_EQ(time.who.toStdString(), who);
    }
}

TEST(LoginOf, IsOneLineOfLatin1WhoeverCalls)
{
    EXPECT_EQ(loginOf("anna"), "anna");
    EXPECT_EQ(loginOf("J\xc3\xbcrg"), "J\xfcrg");
    EXPECT_EQ(loginOf("\xd0\x96 \xf0\x9f\x98\x80"), "\\u0416 \\ud83d\\ude00");
    EXPECT_EQ(loginOf("a\nb\\c\t"), "a\\u000ab\\u005cc\\u0009");
}

}  // namespace
