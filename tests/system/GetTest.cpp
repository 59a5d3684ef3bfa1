#include "CommandLineFixture.h"
#include "support/HttpServer.h"
#include "support/ObjectServer.h"
#include "support/Process.h"

#include <sys/file.h>

#include <atomic>

using namespace Kdd;

namespace
{

class Get : public CommandLine
{
protected:
    Get() { QDir().mkpath(images()); }

    /// Into the folder of images, under the URL's own name.
    Answer get(const std::string& url) const
    {
        return kdd("get --json -o @", QStringList{QString::fromStdString(url)});
    }

    QStringList names() const { return QDir(images()).entryList(QDir::Files); }
};

TEST_F(Get, WritesTheObjectUnderItsNameAndNothingOfAnErrorPage)
{
    const NginxServer server(NginxServer::Scheme::Http, "location = /old { return 307 /a.dcm; }"
                                                        "location = /round { return 302 /round; }");
    const QByteArray object = someObject(20'000'000);
    server.addFile("a.dcm", object);
    server.addFile("empty", {});
    EXPECT_EQ(get(server.url("a.dcm?x=1")).number("bytes"), object.size());
    EXPECT_EQ(get(server.url("old")).exitCode, 0);
    EXPECT_TRUE(bytes("a.dcm") == object && bytes("old") == object);
    EXPECT_EQ(get(server.url("empty")).exitCode, 0);
    EXPECT_EQ(bytes("empty"), "");
    put("absent", "from before");
    const std::pair<std::string, const char*> faults[] = {{server.url("absent"), "HTTP response code 404"},
                                                          {server.url("round"), "more than 5 times"},
                                                          {"http://127.0.0.1:1/x", "Failed to connect"}};
    for (const auto& [url, reason] : faults) {
        const Answer answer = get(url);
        EXPECT_EQ(answer.exitCode, 1);
        EXPECT_EQ(answer.err.count(reason), 1) << answer.err.toStdString();
        EXPECT_EQ(answer.err.count('\n'), 1);
    }
    EXPECT_EQ(get("ftp://a/b").exitCode, 2);
    EXPECT_EQ(get(server.url("")).exitCode, 2);
    EXPECT_EQ(bytes("absent"), "from before");
    EXPECT_EQ(names().join(QLatin1Char(' ')).toStdString(), "a.dcm absent empty old");
}

/// Cuts every body short until it is told to stop; then gives all, of one version or the other.
class Resumed : public Get
{
protected:
    std::atomic<bool> cuts{true};
    std::atomic<bool> changed{false};
    const QByteArray object = someObject(3'000'000);
    const ObjectServer server{object, [this](ObjectServer::Answer& answer) {
                                  if (cuts)
                                      answer.body.chop(1'000'000);
                                  if (changed)
                                      answer.entityTag = "\"v2\"";
                              }};
};

TEST_F(Resumed, GoesOnWhereTheRunBeforeEndedUnlessAnotherProcessDoes)
{
    const Answer broken = get(server.url());
    EXPECT_EQ(broken.exitCode, 1);
    EXPECT_TRUE(broken.err.contains("1000000 bytes early")) << broken.err.toStdString();
    cuts = false;
    {
        QFile part(file("object.part"));
        ASSERT_TRUE(part.open(QIODevice::ReadOnly));
        ASSERT_EQ(::flock(part.handle(), LOCK_EX), 0);
        const Answer second = get(server.url());
        EXPECT_EQ(second.exitCode, 1);
        EXPECT_TRUE(second.err.contains("another process is fetching it")) << second.err.toStdString();
    }
    EXPECT_EQ(bytes("object.part"), object.left(2'000'000));
    const Answer answer = get(server.url());
    EXPECT_EQ(answer.exitCode, 0) << answer.err.toStdString();
    EXPECT_EQ(answer.number("resumedAt"), 2'000'000);
    EXPECT_TRUE(server.requests().back().contains("Range: bytes=2000000-"));
    EXPECT_EQ(bytes("object"), object);
    EXPECT_EQ(names(), QStringList{QStringLiteral("object")});
}

TEST_F(Resumed, BeginsAnewWhenTheObjectIsAnother)
{
    EXPECT_EQ(get(server.url()).exitCode, 1);
    cuts = false;
    changed = true;
    EXPECT_EQ(get(server.url()).number("resumedAt"), 0);
    EXPECT_EQ(bytes("object"), object);
}

TEST_F(Resumed, KeepsWhatItHasWhenTheDiskIsFull)
{
    cuts = false;
    {
        const FullDisk disk(1'000'000);
        const Answer full = get(server.url());
        EXPECT_EQ(full.exitCode, 1);
        EXPECT_TRUE(full.err.contains("object.part cannot be written: File too large"))
            << full.err.toStdString();
    }
    EXPECT_EQ(get(server.url()).number("resumedAt"), 1'000'000);
    EXPECT_EQ(bytes("object"), object);
}

}  // namespace
