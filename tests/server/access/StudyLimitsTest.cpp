#include "server/ServerFixture.h"
#include "server/access/RightsTable.h"
#include "server/access/TokenIssuer.h"
#include "support/CorrectionJob.h"

#include <QDir>

using namespace Kdd;
using namespace Kdd::Access;

namespace
{

/// An archive of a study "1.2" of North and one "1.9" of South, and those who may see what is North's only.
class StudyLimits : public ServerFixture
{
protected:
    StudyLimits()
    {
        QDir().mkpath(mStore.filePath("images"));
        save("north", anImage("1.2.3.1").with("InstitutionName=North|PatientName=A"));
        save("south", southern("1.9.3.1"));
        kdd("add " + mStore.filePath("images").toUtf8());
        takeObjects();
        mSettings.changes.corrections = mSettings.changes.deletions = true;
        mSettings.access =
            mIssuer.rules(mStore.folder(), R"("rights":[{"gives":["read","store","correct","delete"]}],)"
                                           R"("studies":[{"claim":"sites","attribute":"InstitutionName"}])");
        start();
    }

    static DatasetBuilder southern(const char* uid)
    {
        return anImage(uid).inStudy("1.9").inSeries("1.9.3").with("PatientID=7|InstitutionName=South");
    }
    void save(const char* name, const DatasetBuilder& image) const
    {
        image.save(mStore.filePath("images/") + QLatin1String(name));
    }
    /// A header with a token of the sites; without sites it has no such claim.
    QByteArray token(const QJsonValue& sites) const
    {
        QJsonObject claims = TokenIssuer::lastingClaims();
        if (!sites.isUndefined())
            claims.insert(QStringLiteral("sites"), sites);
        return "Authorization: Bearer " + mIssuer.token(claims) + "\r\n";
    }
    Reply ask(const QByteArray& method, const QByteArray& path, const QByteArray& headers,
              const QByteArray& body = {}, const QByteArray& type = "application/dicom") const
    {
        return ServerFixture::ask(method, path, "Content-Type: " + type + "\r\n" + headers, body);
    }
    QByteArray get(const QByteArray& path, const QByteArray& headers) const
    {
        return ask("GET", path, headers).body;
    }

    /// Status, header and body without what differs from answer to answer.
    std::string sameOf(const QByteArray& method, QByteArray path, const QByteArray& study,
                       const QByteArray& headers) const
    {
        path.replace("{s}", study);
        const Reply reply = ask(method, path, headers);
        QByteArray text = QByteArray::number(reply.status) + '\n';
        for (const QByteArray& line : reply.head.split('\n'))
            if (!line.startsWith("X-Request-Id") && !line.startsWith("Date"))
                text += line + '\n';
        return (text + reply.body).toStdString();
    }

    /// Where an answer about a study may come from: each resource on each level, with each kind of address.
    static QVector<QByteArray> paths()
    {
        QVector<QByteArray> all = {"/wado?requestType=WADO&studyUID={s}&seriesUID=1.9.3&objectUID=1.9.3.1",
                                   "/browser/config"};
        for (const char* rest : {"", "/sizes", "/corrections", "/preview", "/difference?a=1.9.3.1&b=1.9.3.1",
                                 "/series/1.9.3/preview", "/series/1.9.3/images", "/images/1.9.3.1/preview",
                                 "/images/1.9.3.1/attributes"})
            all << QByteArray("/browser/studies/{s}") + rest;
        for (const QByteArray& resource : RightsTable::resources())
            for (const char* level : {"", "/studies/{s}", "/studies/{s}/series/1.9.3",
                                      "/studies/{s}/series/1.9.3/instances/1.9.3.1"})
                for (const char* rest : {"", "/1", "/1/rendered", "?StudyInstanceUID={s}",
                                         "?studyUID={s}&seriesUID=1.9.3&objectUID=1.9.3.1&requestType=WADO"})
                    all << QByteArray("/dicom-web") + level + (resource.isEmpty() ? "" : "/" + resource) +
                               rest;
        return all;
    }

    const TokenIssuer mIssuer;
};

TEST_F(StudyLimits, AnswerOfEveryResourceAsIfOthersDidNotExist)
{
    const QByteArray limited = token(QStringLiteral("North"));
    const QByteArray whole = token(QJsonArray{QStringLiteral("*")});
    // What changes something comes last.
    for (const char* method : {"GET", "HEAD", "OPTIONS", "POST", "DELETE", "PUT"}) {
        int seen = 0;
        for (const QByteArray& path : paths()) {
            const std::string hidden = sameOf(method, path, "1.9", limited);
            EXPECT_EQ(hidden, sameOf(method, path, "1.8", limited)) << method << ' ' << path.constData();
            if (*method != 'G')
                continue;
            EXPECT_EQ(hidden.find("1.9.3"), std::string::npos) << hidden;
            seen += hidden != sameOf(method, path, "1.9", whole) ? 1 : 0;
        }
        if (*method == 'G') {
            EXPECT_GE(seen, 20) << "there is something to hide";
        }
    }
    EXPECT_EQ(ask("GET", "/dicom-web/studies/1.9/metadata", whole).status, 200);
}

TEST_F(StudyLimits, FollowTheClaim)
{
    const std::pair<QJsonValue, const char*> kClaims[] = {
        {QStringLiteral("North"), "1.2"},
        {QJsonArray{QStringLiteral("South"), QStringLiteral("Nowhere")}, "1.9"},
        {QJsonArray{QStringLiteral("South"), QStringLiteral("North")}, "1.2 1.9"},
        {QStringLiteral("*"), "1.2 1.9"},
        {QJsonArray{QStringLiteral("x"), QStringLiteral("*")}, "1.2 1.9"},
        {QStringLiteral("N*"), ""},
        {QStringLiteral("North South"), ""},
        {QStringLiteral("north"), ""},
        {QStringLiteral(""), ""},
        {QJsonValue(), ""},
        {7, ""},
        {QJsonValue(QJsonValue::Undefined), ""},
    };
    for (const auto& [sites, studies] : kClaims) {
        const QByteArray headers = token(sites);
        QByteArrayList found;
        for (const QByteArray study : {"1.2", "1.9"}) {
            const int status = ask("GET", "/dicom-web/studies/" + study + "/metadata", headers).status;
            const bool isListed = get("/dicom-web/studies", headers).contains("\"" + study + "\"");
            EXPECT_EQ(status, isListed ? 200 : 404) << study.constData();
            EXPECT_EQ(get("/dicom-web/changefeed", headers).contains("\"" + study + "\""), isListed);
            if (isListed)
                found << study;
        }
        EXPECT_EQ(found.join(' ').toStdString(), studies);
    }
    QJsonArray many;
    for (int i = 0; i < 500; ++i)
        many.append(QString::number(i));
    EXPECT_EQ(ask("GET", "/dicom-web/studies", token(many)).status, 200);
    many.append(QStringLiteral("North"));
    EXPECT_EQ(ask("GET", "/dicom-web/studies", token(many)).status, 401);
    const Reply page = ask("GET", "/dicom-web/studies?limit=1", token(QStringLiteral("North")));
    EXPECT_EQ(page.header("Warning"), "") << "others are not counted";
    EXPECT_EQ(get("/dicom-web/patients", token(QStringLiteral("North"))).count("00201200"), 1);
}

TEST_F(StudyLimits, FollowCorrectionsAndArrivals)
{
    const QByteArray north = token(QStringLiteral("North"));
    const auto store = [&](const DatasetBuilder& image, const QByteArray& path = "/dicom-web/studies") {
        const Reply reply = ask("POST", path, north, image.file());
        return reply.status * 1000 + reply.body.contains("292");  // 0124, not allowed
    };
    EXPECT_EQ(store(anImage("1.2.3.2").with(DCM_InstitutionName, "North")), 200000);
    EXPECT_EQ(store(anImage("1.2.3.3").without(DCM_InstitutionName)), 200000) << "it joins what he may see";
    EXPECT_EQ(store(anImage("1.2.3.4").with(DCM_InstitutionName, "South")), 409001);
    EXPECT_EQ(store(anImage("5.1").inStudy("5").inSeries("5.0").with(DCM_InstitutionName, "North")), 200000);
    EXPECT_EQ(store(anImage("6.1").inStudy("6").inSeries("6.0")), 409001);
    EXPECT_EQ(store(southern("1.9.3.2").with(DCM_InstitutionName, "North")), 409001);
    EXPECT_EQ(store(southern("1.9.3.2").with(DCM_InstitutionName, "North"), "/dicom-web/studies/1.9"),
              409001);
    EXPECT_TRUE(get("/dicom-web/studies", north).contains("\"5\"")) << "at once";
    EXPECT_EQ(ask("GET", "/dicom-web/studies/5/metadata", north).status, 200);
    const QByteArray tag = ask("GET", "/dicom-web/studies/1.2/metadata", north).header("ETag");
    putFile(mStore.filePath("job.xml"), jobXml(DCM_InstitutionName, "South"));
    kdd("qa " + mStore.filePath("job.xml").toUtf8() + " --study 1.2 --image 1.2.3.1");
    EXPECT_EQ(ask("GET", "/dicom-web/studies/1.2/metadata", north + "If-None-Match: " + tag + "\r\n").status,
              404);
    EXPECT_EQ(get("/dicom-web/studies/1.2/series", north), "[]");
}

TEST_F(StudyLimits, KeepMovedImagesInSight)
{
    const auto move = [&](const QByteArray& from, const QByteArray& to, const char* preview,
                          const QByteArray& headers) {
        return ask("POST", "/dicom-web/studies/1.2/corrections?all=true" + QByteArray(preview), headers,
                   jobXml(DCM_StudyInstanceUID, to, from), "application/xml")
            .status;
    };
    const QByteArray north = token(QStringLiteral("North"));
    for (const char* preview : {"&preview=true", ""}) {
        EXPECT_EQ(move("1.2", "1.9", preview, north), 403) << preview;
        EXPECT_EQ(move("1.9", "1.2", preview, north), 403) << preview;
        EXPECT_EQ(move("1.2", "1.8", preview, north), 403) << preview << "where nobody knows who may see it";
    }
    EXPECT_EQ(move("1.2", "1.9", "&preview=true", token(QStringLiteral("*"))), 200);
    EXPECT_EQ(ask("GET", "/dicom-web/studies/1.2/metadata", north).status, 200);
}

TEST_F(StudyLimits, AreRefusedWhereTheyKeepNothing)
{
    const QByteArray begin =
        R"({"tokens":{"issuer":"i","audience":"a","keys":"k","rights":[{"gives":["read"]}],)";
    const std::pair<QByteArray, const char*> kFiles[] = {
        {begin + R"("studies":[{"claim":"c","attribute":"ReferringPhysicianName"}]}})", ""},
        {begin + R"("studies":[{"claim":"c","attribute":"0020000D"}]}})", ""},
        {begin + R"("studies":[{"claim":"c","attribute":"InstitutionNam"}]}})", "no attribute by which"},
        {begin + R"("studies":[{"claim":"c","attribute":"PixelData"}]}})", "no attribute by which"},
        {begin + R"("studies":[{"claim":"c","attribute":"StudyDate"}]}})", "no attribute by which"},
        {begin + R"("studies":[{"claim":"c","attribute":"OtherPatientNames"}]}})", "no attribute by which"},
        {begin + R"("studies":[{"attribute":"InstitutionName"}]}})", "tokens.studies.claim is no text"},
        {begin + R"("studies":[]}})", "tokens.studies is no list"},
        {begin + R"("studies":[{"claim":"c","attribute":"StudyID"}]},"anyone":["read"]})", "keeps nothing"},
    };
    for (const auto& [text, expected] : kFiles) {
        AccessRules rules;
        const std::string fault = AccessRules::parse(text, rules).text().toStdString();
        EXPECT_TRUE(*expected == '\0' ? fault.empty() : fault.find(expected) != std::string::npos) << fault;
    }
}

}  // namespace
