#include "server/faults/Served.h"

#include <QCryptographicHash>

#include <sys/resource.h>
#include <unistd.h>

using namespace Kdd;

namespace
{

const QByteArray kLarge = "studies/1.2/series/1.2.3/instances/1/pixeldata";
const QByteArray kBytes = "Accept: application/octet-stream\r\n";
const QByteArray kGzip = "Accept-Encoding: gzip\r\n";

class ProcessFaults : public Served
{
protected:
    void addLargeImage()
    {
        save("1", aLargeImage(48, 100));
        ASSERT_EQ(addImages().exitCode, 0);
    }

    /// So many that their answer is kept.
    void addManyImages() const
    {
        for (int i = 1; i <= 50; ++i) {
            const QByteArray uid = QByteArray::number(i);
            // What does not get much shorter.
            const QByteArray comment = QCryptographicHash::hash(uid, QCryptographicHash::Sha256).toHex();
            save(uid.constData(), anImage(uid).with(DCM_ImageComments, comment));
        }
        ASSERT_EQ(addImages().exitCode, 0);
    }

    QStringList keptAnswers() const { return filesBelow(path("store/meta/answers")); }

    /// A client that has the head of a large answer and no more.
    std::unique_ptr<Client> startedClient(Reply& head) const
    {
        auto client = std::make_unique<Client>(mAddress, Client::Tls::No, 65536);
        client->get("/dicom-web/" + kLarge, kBytes);
        head = client->reply(Client::Body::StaysBehind);
        EXPECT_EQ(head.status, 200);
        return client;
    }
};

TEST_F(ProcessFaults, AStoreThatCanBeReadOnlyIsServedAndFollowed)
{
    addTwoStudies();
    EXPECT_EQ(::chmod(mFolder.path().toLocal8Bit().constData(), 0755), 0);
    const bool isRoot = ::geteuid() == 0;
    if (!isRoot)
        GTEST_SKIP() << "only an administrator can be another user";
    serve("--threads 1", "", "setpriv --reuid nobody --regid nogroup --clear-groups");
    const auto expectServed = [this](const char* studies) {
        EXPECT_EQ(get("studies").body.count("\"00201208\""), QByteArray(studies).toInt());
        EXPECT_EQ(get("studies/1.3/metadata", kGzip).status, 200);
        EXPECT_EQ(get("studies/1.3/series/1.3.1/instances/4", "Accept: */*\r\n").status, 200);
        EXPECT_EQ(status("/readyz").status, 200);
    };
    expectServed("2");
    // The database's file is changed by somebody who may.
    EXPECT_EQ(kdd("delete 1.2").exitCode, 0);
    expectServed("1");
    save("5", anImage("5").inStudy("1.5").inSeries("1.5.1"));
    EXPECT_EQ(addImages().exitCode, 0);
    expectServed("3");
    EXPECT_EQ(end(), 0);
}

TEST_F(ProcessFaults, AFullDiskKeepsNoAnswersAndGivesThemAll)
{
    addManyImages();
    serve();
    const Reply kept = get("studies/1.2/metadata", kGzip);
    ASSERT_TRUE(kept.isWhole);
    EXPECT_EQ(keptAnswers().size(), 1);
    QDir(path("store/meta/answers")).removeRecursively();
    end();
    serve({}, "trap '' XFSZ; ulimit -f 1;");
    for (int i = 0; i < 3; ++i) {
        const Reply reply = get("studies/1.2/metadata", kGzip);
        EXPECT_TRUE(reply.isWhole && reply.body == kept.body)
            << i << ' ' << reply.head.constData() << reply.body.size() << " of " << kept.body.size();
        EXPECT_EQ(reply.header("ETag"), kept.header("ETag"));
    }
    EXPECT_EQ(keptAnswers(), QStringList());
}

TEST_F(ProcessFaults, WithoutDescriptorsItSaysSoAndGoesOnWhenThereAreSomeAgain)
{
#ifdef KDD_IS_SANITIZED
    GTEST_SKIP() << "the sanitizers' runtime takes descriptors of its own";
#endif
    addLargeImage();
    serve("--threads 4");
    Client connected(mAddress);
    const auto statusOf = [&](const QByteArray& target) {
        const Reply reply = connected.ask("/dicom-web/" + target, "Accept: */*\r\n");
        EXPECT_TRUE(reply.isWhole);
        return reply.status;
    };
    const QByteArray metadata = "studies/1.2/metadata";
    EXPECT_EQ(statusOf(metadata), 200);
    const auto pid = static_cast<pid_t>(mServer->processId());
    rlimit former = {};
    ASSERT_EQ(::prlimit(pid, RLIMIT_NOFILE, nullptr, &former), 0);
    const rlimit none = {3, former.rlim_max};
    ASSERT_EQ(::prlimit(pid, RLIMIT_NOFILE, &none, nullptr), 0);
    Client waiting(mAddress);
    waiting.get("/dicom-web/" + metadata);
    for (const QByteArray& target : {metadata, kLarge, QByteArray("studies/1.2")})
        EXPECT_GE(statusOf(target), 500) << "not \"gone\": " << target.constData();
    ASSERT_EQ(::prlimit(pid, RLIMIT_NOFILE, &former, nullptr), 0);
    EXPECT_EQ(waiting.reply().status, 200);
    for (const QByteArray& target : {metadata, kLarge, QByteArray("studies/1.2")})
        EXPECT_EQ(statusOf(target), 200) << target.constData();
}

TEST_F(ProcessFaults, ClientsThatVanishLeaveNothing)
{
    addLargeImage();
    serve("--threads 4");
    onThreads(8, [this](int) { EXPECT_TRUE(get(kLarge, kBytes).isWhole && get("studies").status == 200); });
    ASSERT_TRUE(hasNoConnections());
    const qint64 descriptors = openDescriptors();
    Reply head;
    for (int i = 0; i < 50; ++i)
        startedClient(head)->reset();
    EXPECT_TRUE(hasNoConnections());
    EXPECT_TRUE(comesTrue([&] { return openDescriptors() <= descriptors; }))
        << openDescriptors() << descriptors;
    EXPECT_TRUE(get(kLarge, kBytes).isWhole);
}

TEST_F(ProcessFaults, AThousandClientsThatDoNotReadTakeLittleMemory)
{
#ifdef KDD_IS_SANITIZED
    GTEST_SKIP() << "the sanitizers' runtime takes memory of its own";
#endif
    addLargeImage();
    serve("--threads 4");
    std::vector<std::unique_ptr<Client>> clients;
    for (int i = 0; i < 1000; ++i) {
        clients.push_back(std::make_unique<Client>(mAddress, Client::Tls::No, 4096));
        // From a file, and made as it is sent.
        clients.back()->get("/dicom-web/" + QByteArray(i % 2 == 0 ? kLarge : "studies/1.2"),
                            i % 2 == 0 ? kBytes : "");
    }
    EXPECT_TRUE(comesTrue([this] { return get("studies").status == 200; }))
        << "when the others were answered";
    EXPECT_TRUE(get(kLarge, kBytes).isWhole);
    EXPECT_LT(memory(), 256 * 1024);
}

TEST_F(ProcessFaults, WhatIsInFlightIsEndedWhenItIsAsked)
{
    addLargeImage();
    serve();
    Reply head;
    const auto client = startedClient(head);
    signal(SIGTERM);
    EXPECT_TRUE(client->bodyAfter(head).isWhole);
    EXPECT_TRUE(mServer->waitForFinished(kTimeout));
    EXPECT_EQ(mServer->exitCode(), 0);
}

TEST_F(ProcessFaults, AKilledServerLeavesNothingThatTheNextOneGives)
{
    addManyImages();
    addLargeImage();
    serve();
    const QByteArray metadata = "studies/1.2/metadata";
    const Reply before = get(metadata, kGzip);
    Reply head;
    for (int round = 0; round < 3; ++round) {
        QDir(path("store/meta/answers")).removeRecursively();
        Client asking(mAddress);
        asking.get("/dicom-web/" + metadata, kGzip);
        const auto client = startedClient(head);
        EXPECT_EQ(end(SIGKILL), -1);
        EXPECT_FALSE(client->bodyAfter(head).isWhole);
        serve();
        const Reply after = get(metadata, kGzip);
        EXPECT_TRUE(after.isWhole && after.body == before.body);
        EXPECT_EQ(after.header("ETag"), before.header("ETag"));
    }
}

TEST_F(ProcessFaults, ACertificateIsRenewedWithoutAnEnd)
{
    addTwoStudies();
    const TlsFiles used;
    const TlsFiles renewed;
    const auto take = [&](const QByteArray& certificate, const QByteArray& key) {
        putFile(path("tls.pem"), certificate);
        putFile(path("key.pem"), key);
    };
    const auto contentOf = [](const QByteArray& name) { return fileContent(QFile::decodeName(name)); };
    take(contentOf(used.certificate()), contentOf(used.key()));
    serve("--tls-cert " + path("tls.pem").toUtf8() + " --tls-key " + path("key.pem").toUtf8());
    const auto shown = [this] { return Client(mAddress, Client::Tls::Yes).certificate(); };
    Client client(mAddress, Client::Tls::Yes);
    const QByteArray first = client.certificate();
    EXPECT_EQ(shown(), first);
    take(contentOf(renewed.certificate()), contentOf(renewed.key()));
    signal(SIGHUP);
    EXPECT_TRUE(comesTrue([&] { return shown() != first; }));
    const QByteArray second = shown();
    EXPECT_EQ(client.ask("/dicom-web/studies").status, 200) << "the connection stays";
    take(contentOf(renewed.certificate()), contentOf(used.key()));
    signal(SIGHUP);
    EXPECT_TRUE(comesTrue([this] { return fileContent(path("log")).contains("former certificate"); }));
    EXPECT_EQ(shown(), second) << "what does not fit together is not taken";
    EXPECT_EQ(end(), 0);
}

}  // namespace
