#include "SampleArchive.h"

#include "kddlib/tagfile/TagFile.h"
#include "support/ServiceAccount.h"

#include <QFileInfo>
#include <QRegularExpression>

namespace Kdd
{

namespace
{

constexpr char kJob[] = "<Job><Substitutions><Tag Group='0010' Element='0010'><Value>Roe^R</Value></Tag>"
                        "</Substitutions></Job>";
constexpr char kStudy[] = "2.25.206249426979943135884564004311187862184";
constexpr char kImage[] = "2.25.118095209191961083373906363074726608325\n";
constexpr char kToken[] =
    "HTTP/1.1 200 OK\r\n\r\n{\"access_token\":\"t\",\"token_type\":\"Bearer\",\"expires_in\":3600}";

}  // namespace

SampleArchive::SampleArchive()
    : mTokens([](const QByteArray&) -> ScriptedServer::Reply { return {kToken}; })
{
    mEnvironment.insert(QStringLiteral("KDD_STORE"), path("store"));
    mEnvironment.insert(QStringLiteral("PATH"), QFileInfo(QStringLiteral(KDD_BINARY)).path() +
                                                    QLatin1Char(':') +
                                                    mEnvironment.value(QStringLiteral("PATH")));
    mEnvironment.insert(QStringLiteral("KDD_CLOUD_DOWNLOAD"), QString::fromStdString(mServer.url("")));
    mServer.addFile("a.dcm", "of the server");
    QDir(mFolder.path()).mkdir(QStringLiteral("viewer"));
    putBeside("viewer/index.html", "<html>");
    putBeside("job.xml", kJob);
    putBeside("images.txt", kImage);
    putBeside("scan.dcm", "of this machine");
    putBeside("account.json", QJsonDocument(ServiceAccount().key(mTokens.url(""))).toJson());
}

void SampleArchive::fill()
{
    const Answer filled =
        shell({QStringLiteral("kdd --quiet sample day --images 60"), QStringLiteral("kdd --quiet add day")});
    EXPECT_EQ(filled.exitCode, 0) << filled.err.toStdString();
    TagFile::setMetaFolder(QFile::encodeName(path("store/meta")).constData());
    QFile::remove(path("copy.tc"));
    EXPECT_TRUE(QFile::copy(TagFile::cacheFilePathForStudy(kStudy), path("copy.tc")));
}

Answer SampleArchive::run(const QString& program, const QStringList& arguments) const
{
    QProcess process;
    process.setWorkingDirectory(mFolder.path());
    process.setProcessEnvironment(mEnvironment);
    process.start(program, arguments);
    return finish(process);
}

QString SampleArchive::substituted(QString text) const
{
    const std::pair<const char*, QString> kStandIns[] = {
        {"https://host/", QString::fromStdString(mServer.url(""))},
        {"gs://bucket/a.dcm", QString::fromStdString(mServer.url("a.dcm"))},
        {"/etc/kdd/service-account.json", path("account.json")},
        {"postgresql:///kdd?host=/var/run/postgresql", QStringLiteral("sqlite:/var/lib/kdd/kdd.sqlite")},
        {"/var/lib/kdd", path("store")},
    };
    for (const auto& [there, here] : kStandIns)
        text.replace(QLatin1String(there), here);
    // A server is asked to end as soon as it has begun. Its port may be taken here.
    text.replace(QRegularExpression(QStringLiteral("^(kdd (?:serve|receive).*) 11112")),
                 QStringLiteral("\\1 0"));
    text.replace(QRegularExpression(QStringLiteral("^(kdd (?:serve|receive)[^#]*)(#.*)?$")),
                 QStringLiteral("rm -f served; mkfifo served; KDD_SERVER_LISTEN=127.0.0.1:0 \\1 >served &\n"
                                "read -r line <served; kill $!; wait $!"));
    // A worker is asked to end as soon as it listens to that, which the mask of the signals that it catches tells.
    text.replace(
        QRegularExpression(QStringLiteral("^(kdd build --forever[^#]*)(#.*)?$")),
        QStringLiteral("\\1 &\nuntil grep -q '^SigCgt:.*[4567cdef]...$' /proc/$!/status; do sleep 0.1; done\n"
                       "kill $!; wait $!"));
    // The door builds and tests everything, this test included: here it only has to know the word.
    text.replace(QRegularExpression(QStringLiteral("^\\./dev (\\w+)")),
                 QStringLiteral(KDD_SOURCES "/dev | grep '^  \\1 '"));
    return text;
}

Answer SampleArchive::shell(const QStringList& commands) const
{
    QString script = QStringLiteral("set -ex\n");
    for (const QString& command : commands)
        script += substituted(command) + QLatin1Char('\n');
    return run(QStringLiteral("sh"), {QStringLiteral("-c"), script});
}

}  // namespace Kdd
