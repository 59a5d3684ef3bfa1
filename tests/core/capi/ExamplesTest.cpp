#include "CatalogueFixture.h"
#include "support/HttpServer.h"
#include "support/ObjectServer.h"

#include <QProcess>
#include <QStandardPaths>

namespace Kdd
{
namespace
{

/// The examples as processes of their own, which see nothing but the shared library.
class Examples : public CatalogueFixture
{
protected:
    Examples() { server.addFile("object", object); }

    /// What a program prints, and its exit code.
    static std::string run(const char* program, const QStringList& arguments,
                           const QStringList& environment = QProcess::systemEnvironment())
    {
        QProcess process;
        process.setEnvironment(environment);
        process.setProcessChannelMode(QProcess::ForwardedErrorChannel);
        process.start(QString::fromLocal8Bit(program), arguments);
        EXPECT_TRUE(process.waitForFinished(120000));
        return process.readAllStandardOutput().toStdString() + std::to_string(process.exitCode());
    }

    /// What Python needs for loading a library that is built with a sanitizer.
    static QStringList pythonEnvironment()
    {
        return QStringLiteral(KDD_PYTHON_ENVIRONMENT).split(QLatin1Char('|'), Qt::SkipEmptyParts);
    }

    QString url(const char* name) const { return QString::fromStdString(server.url(name)); }
    QString target() const { return mStore.filePath("target"); }

    const QByteArray object = someObject(200000);
    NginxServer server;
};

TEST_F(Examples, FetchAnObject)
{
    EXPECT_EQ(run(KDD_FETCH_OBJECT, {url("object"), target()}), "200000 of 200000 bytes\n0");
    EXPECT_EQ(fileContent(target()), object);
    EXPECT_EQ(run(KDD_FETCH_OBJECT, {url("absent"), target()}), "1");
    EXPECT_EQ(run(KDD_FETCH_OBJECT, {QStringLiteral("ftp://a"), target()}), "2");
}

TEST_F(Examples, StreamFromPython)
{
    const QString python = QStandardPaths::findExecutable(QStringLiteral("python3"));
    if (python.isEmpty())
        GTEST_SKIP() << "there is no python3";
    // What is found may be a script that chooses among several; that one the sanitizers' runtimes do not suit.
    const QString which = QStringLiteral("import sys; print(sys.executable, end='')");
    const std::string chosen = run(python.toLocal8Bit().constData(), {QStringLiteral("-c"), which});
    const std::string interpreter = chosen.substr(0, chosen.size() - 1);
    const QStringList environment = QProcess::systemEnvironment() + pythonEnvironment();
    const QStringList script = {QStringLiteral(KDD_STREAM_SCRIPT), QStringLiteral(KDD_LIBRARY)};
    EXPECT_EQ(run(interpreter.c_str(), script + QStringList{url("object")}, environment),
              "200000 of 200000 bytes\n0");
    EXPECT_EQ(run(interpreter.c_str(), script + QStringList{url("absent")}, environment), "1");
}

TEST_F(Examples, SaveASyncedTagFile)
{
    writeStudy("1.2", {"1", "2"});
    registerImages("1.2", {"2"});
    ASSERT_TRUE(mCatalogue->setConfig("Storage", "MetaFolder", TagFile::metaFolder()).good());
    const QString database = QString::fromUtf8(mAddress);
    const std::string printed = run(KDD_SYNCED_TAG_FILE, {database, QStringLiteral("1.2"), target()});
    EXPECT_EQ(printed, std::to_string(fileContent(target()).size()) + " bytes\n0");
    TagFile file;
    ASSERT_TRUE(file.readCacheFile(target(), "1.2", false));
    EXPECT_EQ(file.imagesByUID().keys(), Uids{"2"});
    EXPECT_EQ(run(KDD_SYNCED_TAG_FILE, {database, QStringLiteral("9"), target()}), "1");
}

}  // namespace
}  // namespace Kdd
