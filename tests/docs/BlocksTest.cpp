#include "Pages.h"
#include "SampleArchive.h"
#include "kddlib/tagfile/qa/QAData.h"
#include "support/PostgresServer.h"

#include <QJsonDocument>
#include <QJsonObject>
#include <QSettings>

using namespace Kdd;

namespace
{

/// What the pages show, done as they say.
class Blocks : public SampleArchive
{
protected:
    /// A job, said of an image that is there.
    static QString withOwnImages(QString job)
    {
        return job
            .replace(QLatin1String("1.2.840.1.1"),
                     QStringLiteral("2.25.118095209191961083373906363074726608325"))
            .replace(QLatin1String("\"1.2.840.1.2\""), QString())
            .replace(QLatin1String("1.2.840.1"),
                     QStringLiteral("2.25.206249426979943135884564004311187862184"));
    }

    /// An access file with a member that its page shows alone.
    static QJsonObject withMember(QJsonObject file, const QJsonObject& member)
    {
        const QString name = member.begin().key();
        QJsonObject tokens = file.value(QLatin1String("tokens")).toObject();
        const bool isOfTokens = name == QLatin1String("studies");
        (isOfTokens ? tokens : file).insert(name, member.begin().value());
        file.insert(QStringLiteral("tokens"), tokens);
        // Beside limits nobody else may have a right.
        if (isOfTokens)
            file.remove(QStringLiteral("anyone"));
        return file;
    }

    /// The file is good as far as another one that is not there.
    void expectRefusal(const char* command, const QByteArray& file, const char* missing) const
    {
        putBeside("block.json", file);
        const Answer answer =
            shell({QStringLiteral("KDD_SERVER_LISTEN=127.0.0.1:0 ") + QLatin1String(command)});
        EXPECT_EQ(answer.exitCode, 1) << command;
        EXPECT_TRUE(answer.err.contains(missing)) << command << answer.err.toStdString();
    }
};

TEST_F(Blocks, AllSayInWhichLanguageTheyAreAndAreTested)
{
    // "text" is for layouts and diagrams, which nothing can run.
    const QStringList languages =
        QStringLiteral("c cmake console cpp ini json nginx python sh sql text xml").split(QLatin1Char(' '));
    for (const Block& block : allBlocks())
        EXPECT_TRUE(languages.contains(block.language))
            << block.place() << " is in \"" << block.language.toStdString()
            << "\", which no test knows how to run";
    EXPECT_EQ(blocksIn("cpp").size() + blocksIn("c").size(), std::size_t(KDD_COMPILED_BLOCKS))
        << "the build compiles them";
}

TEST_F(Blocks, OfCommandsCanBeTyped)
{
    for (const Block& block : blocksIn("console")) {
        QDir(path("store")).removeRecursively();
        const QStringList commands = block.commands();
        // A tour that makes its own studies begins with nothing.
        if (!block.text.contains(QLatin1String("$ kdd sample")))
            fill();
        const Answer answer = shell(commands);
        EXPECT_EQ(answer.exitCode, 0) << block.place() << '\n' << answer.err.toStdString();
    }
    EXPECT_FALSE(mStorage.object("bucket/all.png").isEmpty());
    EXPECT_TRUE(QFile::exists(path("a.dcm")));
}

TEST_F(Blocks, InPythonRunAsFarAsTheirModulesAreThere)
{
    for (const Block& block : blocksIn("python")) {
        putBeside("block.py", block.text.toUtf8());
        const Answer answer = shell({QStringLiteral("python3 block.py")});
        EXPECT_TRUE(answer.exitCode == 0 || answer.err.contains("ModuleNotFoundError"))
            << block.place() << '\n'
            << answer.err.toStdString();
    }
    if (QFile::exists(path("a.vol"))) {
        EXPECT_EQ(shell({QStringLiteral("kdd --json index a.vol")}).number("volumes"), 1);
    }
}

/// What installs, or belongs into a project of the reader's own, is parsed only.
TEST_F(Blocks, ForTheShellAndCMakeAreWellFormed)
{
    for (const Block& block : blocksIn("sh")) {
        putBeside("block.sh", block.text.toUtf8());
        EXPECT_EQ(shell({QStringLiteral("sh -n block.sh")}).exitCode, 0) << block.place();
    }
    for (const Block& block : blocksIn("cmake")) {
        putBeside("block.cmake", "if(FALSE)\n" + block.text.toUtf8() + "endif()\n");
        EXPECT_EQ(shell({QStringLiteral("cmake -P block.cmake")}).exitCode, 0) << block.place();
    }
}

TEST_F(Blocks, ForNginxAreConfigurations)
{
    EXPECT_EQ(
        shell({QStringLiteral("openssl req -x509 -newkey rsa:2048 -nodes -subj /CN=localhost -keyout key.pem "
                              "-out tls.pem 2>/dev/null")})
            .exitCode,
        0);
    for (const Block& block : blocksIn("nginx")) {
        QByteArray text =
            block.text.toUtf8().replace("/etc/kdd/", "").replace("listen 443", "listen 127.0.0.1:8443");
        // Some are whole servers, some stand in one.
        if (!text.contains("\nserver {"))
            text = "server {\n" + text + "}\n";
        putBeside("block.conf",
                  "pid block.pid;\nerror_log stderr;\nevents {}\nhttp {\naccess_log off;\n" + text + "}\n");
        const Answer answer = shell({QStringLiteral("/usr/sbin/nginx -t -p . -c block.conf")});
        EXPECT_EQ(answer.exitCode, 0) << block.place() << answer.err.toStdString();
    }
}

TEST_F(Blocks, InSqlAskAnImageDatabase)
{
    const QString address = QString::fromUtf8(newPostgresDatabase());
    EXPECT_EQ(shell({QStringLiteral("kdd --quiet sample day --images 60"),
                     QStringLiteral("KDD_DATABASE='%1' kdd --quiet index day").arg(address)})
                  .exitCode,
              0);
    for (const Block& block : blocksIn("sql")) {
        putBeside("block.sql", block.text.toUtf8());
        const Answer answer =
            shell({QStringLiteral("psql -v ON_ERROR_STOP=1 -f block.sql '%1'").arg(address)});
        EXPECT_EQ(answer.exitCode, 0) << block.place() << answer.err.toStdString();
        EXPECT_FALSE(answer.out.contains("(0 rows)")) << block.place();
    }
}

TEST_F(Blocks, InXmlAreJobsAndInIniAreSettings)
{
    for (const Block& block : blocksIn("xml")) {
        QAData job;
        QString message;
        EXPECT_TRUE(job.parse(block.text.toUtf8(), message))
            << block.place() << ": " << message.toStdString();
    }
    for (const Block& block : blocksIn("ini")) {
        putBeside("kdd.ini", substituted(block.text).toUtf8());
        const QSettings file(path("kdd.ini"), QSettings::IniFormat);
        EXPECT_FALSE(file.allKeys().isEmpty()) << block.place();
        fill();
        const Answer answer = shell({QStringLiteral("KDD_CONFIG=$PWD/kdd.ini kdd list")});
        EXPECT_EQ(answer.exitCode, 0) << block.place() << '\n' << answer.err.toStdString();
        EXPECT_FALSE(answer.err.contains("setting")) << answer.err.toStdString();
    }
}

/// Jobs are done, files of rights and peers are read by the server, and what is an answer is well formed.
TEST_F(Blocks, InJsonAreWhatTheirPagesSay)
{
    fill();
    QJsonObject rights;
    for (const Block& block : blocksIn("json")) {
        // Some are whole, some a member.
        const bool isMember = !block.text.startsWith(QLatin1Char('{'));
        const QString text = isMember ? QStringLiteral("{%1}").arg(block.text) : block.text;
        const QJsonObject object = QJsonDocument::fromJson(text.toUtf8()).object();
        EXPECT_FALSE(object.isEmpty()) << block.place();
        if (object.contains(QLatin1String("tags"))) {
            putBeside("block.json", withOwnImages(text).toUtf8());
            const Answer answer = shell({QStringLiteral("kdd qa block.json --study 1.2.840.2")});
            EXPECT_EQ(answer.out, "1 images: 1 changed, 1 moved, 0 not found\n") << answer.err.toStdString();
        } else if (block.place().find("dimse.md") != std::string::npos) {
            expectRefusal("kdd receive 0 --peers block.json", text.toUtf8(), "tls.pem");
        } else if (isMember || object.contains(QLatin1String("tokens"))) {
            rights = isMember ? withMember(rights, object) : object;
            // It would run for ever with a certificate.
            expectRefusal("kdd serve --access block.json --tls-cert none.pem --tls-key none.pem",
                          isMember ? QJsonDocument(rights).toJson() : text.toUtf8(), "none.pem");
        }
    }
}

TEST_F(Blocks, ThatAreAProgramNameThePatientOfAnImageThatIsThere)
{
    addTwoStudies();
    const QStringList programs = QStringLiteral(KDD_PROGRAMS).split(QLatin1Char('|'));
    for (const QString& program : programs)
        EXPECT_LE(run(program, {}).exitCode, 2) << "without arguments";
    const auto ask = [&](const char* study, const char* image) {
        return run(programs.first(), {path("store/meta"), QLatin1String(study), QLatin1String(image)});
    };
    EXPECT_TRUE(ask("1.2", "1").out.endsWith("Doe^J\n"));
    for (const auto& [study, image] : {std::pair("1.2", "7"), std::pair("1.3", "4"), std::pair("9", "1")})
        EXPECT_EQ(ask(study, image).exitCode, 1);
}

}  // namespace
