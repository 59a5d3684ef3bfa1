#include "server/access/AuditTrail.h"

#include "support/FileContent.h"
#include "support/LogCapture.h"

#include <QFile>
#include <QJsonDocument>
#include <QJsonObject>

#include <gtest/gtest.h>
#include <sys/stat.h>

using namespace Kdd;
using namespace Kdd::Access;

namespace
{

class AuditTrailTest : public FileTest
{
protected:
    AuditTrailTest()
    {
        Http::Request& request = mExchange.request;
        request.target = "/dicom-web/studies/1.2/metadata?PatientName=Doe";
        request.path = {"dicom-web", "studies", "1.2", "metadata"};
        request.query = {{"PatientName", "Doe"}};
        request.headers = {{"authorization", "Bearer secret"}, {"x-forwarded-for", "10.1.1.1, 10.2.2.2"}};
        request.peer = "10.0.0.9";
        request.id = "r1";
        mExchange.caller = "anna\n\"";
        mExchange.status = 200;
        mExchange.bytes = 5000000000;
        mExchange.duration = std::chrono::microseconds(2500);
        mExchange.isWhole = true;
    }

    void write(const QByteArray& place) const
    {
        AuditTrail trail(place, RightsTable({"dicom-web"}), {"10.0.0.9"});
        ASSERT_EQ(trail.check().text(), QString());
        trail.ended(mExchange);
        trail.ended(mExchange);
    }
    QJsonObject line(int index) const
    {
        return QJsonDocument::fromJson(content().split('\n').value(index)).object();
    }

    Http::Exchange mExchange;
};

TEST_F(AuditTrailTest, TellsWhoDidWhatToWhichStudy)
{
    write(QFile::encodeName(path()));
    QJsonObject first = line(0);
    EXPECT_TRUE(first.take(QStringLiteral("time")).toString().endsWith(QLatin1Char('Z')));
    EXPECT_EQ(
        QJsonDocument(first).toJson(QJsonDocument::Compact).toStdString(),
        R"({"bytes":5000000000,"client":"10.2.2.2","method":"GET","ms":2,"peer":"10.0.0.9","request":"r1",)"
        R"("resource":"metadata","status":200,"studies":["1.2"],"subject":"anna\n\"","whole":true})");
    EXPECT_EQ(line(1).value(QStringLiteral("request")), QStringLiteral("r1"));
    EXPECT_EQ(content().count('\n'), 2);
    struct stat status = {};
    ASSERT_EQ(::stat(QFile::encodeName(path()).constData(), &status), 0);
    EXPECT_EQ(status.st_mode & 07U, 0U) << "it is nobody else's";
}

TEST_F(AuditTrailTest, TellsNothingThatAClientMadeUp)
{
    mExchange.request.path = {"dicom-web", "studies", "Doe^John", "metadata"};
    mExchange.request.peer = "10.0.0.8";
    write(QFile::encodeName(path()));
    mExchange.request.path = {"Doe"};
    write(QFile::encodeName(path()));
    mExchange.request.path = {"dicom-web", "wado"};
    mExchange.request.query = {{"studyUID", "Doe^John"}};
    write(QFile::encodeName(path()));
    EXPECT_EQ(content().count('\n'), 6);
    for (const char* text : {"Doe", "secret", "10.2.2.2"})
        EXPECT_FALSE(content().contains(text)) << text;
}

TEST_F(AuditTrailTest, GoesOnInANewFile)
{
    const AuditTrail none("/none/none/audit", RightsTable({}), {});
    EXPECT_TRUE(none.check().text().contains(QLatin1String("/none/none/audit")));
    AuditTrail trail(QFile::encodeName(path()), RightsTable({"dicom-web"}), {});
    trail.ended(mExchange);
    ASSERT_TRUE(QFile::rename(path(), path() + QStringLiteral(".1")));
    trail.ended(mExchange);
    EXPECT_EQ(content().count('\n'), 1);
    EXPECT_EQ(fileContent(path() + QStringLiteral(".1")).count('\n'), 1);
}

TEST_F(AuditTrailTest, IsMissedOnceWhenItCannotBeWritten)
{
    LogCapture log;
    AuditTrail trail(QFile::encodeName(path() + QStringLiteral("/below")), RightsTable({}), {});
    trail.ended(mExchange);
    trail.ended(mExchange);
    EXPECT_EQ(log.count("The audit trail cannot be written"), 1);
    write("log");
    EXPECT_EQ(log.count("Audit {\"bytes\":5000000000,"), 2);
    EXPECT_EQ(log.count("Doe") + log.count("secret"), 0);
}

}  // namespace
