#include "CommandLineFixture.h"
#include "support/CloudStore.h"
#include "support/HttpServer.h"

#include <QFileInfo>

using namespace Kdd;

namespace
{

/// What the README promises, done as it says.
class Readme : public CommandLine
{
protected:
    Readme()
    {
        mEnvironment.insert(QStringLiteral("KDD_STORE"), mFolder.filePath(QStringLiteral("store")));
        mEnvironment.insert(QStringLiteral("PATH"), QFileInfo(QStringLiteral(KDD_BINARY)).path() +
                                                        QLatin1Char(':') +
                                                        mEnvironment.value(QStringLiteral("PATH")));
    }

    Answer run(const QString& program, const QStringList& arguments) const
    {
        Process process(kNoLimit);
        process.setWorkingDirectory(mFolder.path());
        process.setProcessEnvironment(mEnvironment);
        process.start(program, arguments);
        return finish(process);
    }

    /// The commands of the block for consoles, without what they are told to be for.
    static QStringList tour()
    {
        QFile page(QStringLiteral(KDD_README));
        EXPECT_TRUE(page.open(QIODevice::ReadOnly));
        const QString text = QString::fromUtf8(page.readAll());
        const QString block =
            text.section(QStringLiteral("```console\n"), 1).section(QStringLiteral("```"), 0, 0);
        QStringList commands;
        for (const QString& line : block.split(QLatin1Char('\n'), Qt::SkipEmptyParts)) {
            EXPECT_TRUE(line.startsWith(QLatin1String("$ "))) << line.toStdString();
            commands.append(line.mid(2).section(QStringLiteral(" #"), 0, 0).trimmed());
        }
        return commands;
    }

    void putBeside(const char* name, const QByteArray& content) const
    {
        QFile file(mFolder.filePath(QLatin1String(name)));
        ASSERT_TRUE(file.open(QIODevice::WriteOnly));
        ASSERT_EQ(file.write(content), content.size());
    }

    QProcessEnvironment mEnvironment = QProcessEnvironment::systemEnvironment();
};

TEST_F(Readme, TheTourCanBeTaken)
{
    // What the page leaves to its reader: a server, a storage, a correction.
    const CloudStore storage;
    const NginxServer server;
    server.addFile("a.dcm", "of the server");
    putBeside("job.xml", "<Job><Substitutions><Tag Group='0010' Element='0010'><Value>Roe^R</Value></Tag>"
                         "</Substitutions></Job>");
    for (const char* name : {"KDD_CLOUD_API", "KDD_CLOUD_UPLOAD"})
        mEnvironment.insert(QLatin1String(name), qEnvironmentVariable(name));
    QStringList commands = tour();
    ASSERT_EQ(commands.takeFirst(), QStringLiteral("./dev shell"));  // this is what one has then
    EXPECT_GT(commands.size(), 10);
    for (QString& command : commands) {
        command.replace(QLatin1String("https://host/"), QString::fromStdString(server.url("")));
        const Answer answer = run(QStringLiteral("sh"), {QStringLiteral("-c"), command});
        EXPECT_EQ(answer.exitCode, 0) << command.toStdString() << '\n' << answer.err.toStdString();
    }
    EXPECT_FALSE(storage.object("bucket/all.png").isEmpty());
    EXPECT_TRUE(QFileInfo::exists(mFolder.filePath(QStringLiteral("a.dcm"))));
}

TEST_F(Readme, TheProgramNamesThePatientOfAnImageThatIsThere)
{
    addTwoStudies();
    const QStringList programs = QStringLiteral(KDD_README_PROGRAMS).split(QLatin1Char('|'));
    for (const QString& program : programs)
        EXPECT_LE(run(program, {}).exitCode, 2) << "without arguments";
    const QString meta = mFolder.filePath(QStringLiteral("store/meta"));
    const auto ask = [&](const char* study, const char* image) {
        return run(programs.first(), {meta, QLatin1String(study), QLatin1String(image)});
    };
    EXPECT_TRUE(ask("1.2", "1").out.endsWith("Doe^J\n"));
    EXPECT_EQ(ask("1.2", "1").exitCode, 0);
    for (const auto& [study, image] : {std::pair("1.2", "7"), std::pair("1.3", "4"), std::pair("9", "1")}) {
        const Answer answer = ask(study, image);
        EXPECT_EQ(answer.exitCode, 1);
        EXPECT_FALSE(answer.err.isEmpty());
    }
}

}  // namespace
