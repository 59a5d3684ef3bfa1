#include "server/faults/Served.h"

#include <sys/stat.h>
#include <unistd.h>

#include <functional>

using namespace Kdd;

namespace
{

const QByteArray kImage = "studies/1.2/series/1.2.3/instances/1";

class FileFaults : public Served
{
protected:
    QByteArray name() const { return file("1").toLocal8Bit(); }

    /// Another file in the place of the image's, by its name.
    void replace(const DatasetBuilder& image) const
    {
        save("new", image);
        ASSERT_EQ(::rename(file("new").toLocal8Bit().constData(), name().constData()), 0);
    }

    /// Other bytes in the same file, as a copying program leaves them.
    void overwrite(const DatasetBuilder& image) const
    {
        save("new", image);
        putFile(file("1"), bytes("new"));
        QFile::remove(file("new"));
    }

    void cut() const { ASSERT_EQ(::truncate(name().constData(), 20'000), 0); }
};

const std::pair<const char*, const char*> kResources[] = {
    {"/frames/2", "application/octet-stream"},
    {"/frames/1,2", "*/*"},
    {"", "application/dicom; transfer-syntax=*"},
    {"", "application/dicom"},
    {"", "application/dicom; transfer-syntax=1.2.840.10008.1.2"},
    {"/bulkdata/7FE00010", "*/*"},
    {"/pixeldata", "application/octet-stream"},
    {"/rendered", "image/png"},
};

TEST_F(FileFaults, GiveAnErrorOrTheRightBytes)
{
    save("1", aLargeImage(2, 100));
    ASSERT_EQ(addImages().exitCode, 0);
    serve();
    const auto all = [this](bool isServed) {
        QVector<QByteArray> bodies;
        for (const auto& [target, accept] : kResources) {
            const Reply reply = get(kImage + target, QByteArray("Accept: ") + accept + "\r\n");
            EXPECT_EQ(reply.status == 200, isServed) << target << ' ' << reply.status;
            EXPECT_TRUE(reply.isWhole) << target;
            EXPECT_FALSE(!isServed && reply.body.contains("images"))
                << "no path: " << reply.body.toStdString();
            // Parts are parted by words that are never the same.
            bodies.append(isServed ? reply.body.right(500'000).left(400'000) : QByteArray());
        }
        return bodies;
    };
    const QVector<QByteArray> first = all(true);
    overwrite(aLargeImage(2, 7));
    const QVector<QByteArray> second = all(true);
    for (int i = 0; i < first.size(); ++i)
        EXPECT_EQ(first[i] == second[i], QByteArray(kResources[i].first) == "/rendered")
            << kResources[i].first;
    cut();
    all(false);
    replace(aLargeImage(2, 100, "1.9"));
    all(false);
    QFile::remove(file("1"));
    all(false);
    ASSERT_EQ(::mkfifo(name().constData(), 0600), 0);
    all(false);
    replace(aLargeImage(2, 100));
    EXPECT_TRUE(all(true) == first);
}

const std::tuple<const char*, const char*, bool> kLongAnswers[] = {
    {"/pixeldata", "application/octet-stream", false},
    {"/pixeldata", "application/octet-stream", true},
    {"", "application/dicom; transfer-syntax=*", false},
    {"", "application/zip; transfer-syntax=*", false},
};

TEST_F(FileFaults, InTheMiddleEndTheAnswerUnlessItsBytesAreRight)
{
    constexpr int kFrames = 48;  // more than what is on its way
    const TlsFiles tls;
    const std::tuple<const char*, std::function<void()>, bool> kChanges[] = {
        {"replaced", [this] { replace(aLargeImage(kFrames, 7)); }, true},
        {"overwritten", [this] { overwrite(aLargeImage(kFrames, 7)); }, false},
        {"cut", [this] { cut(); }, false},
    };
    for (const auto& [name, change, isWhole] : kChanges) {
        for (const auto& [target, type, isEncrypted] : kLongAnswers) {
            SCOPED_TRACE(std::string(name) + ' ' + target + ' ' + type);
            save("1", aLargeImage(kFrames, 100));
            ASSERT_EQ(addImages().exitCode, 0);
            serve(isEncrypted ? "--tls-cert " + tls.certificate() + " --tls-key " + tls.key() : "");
            const QByteArray accept = QByteArray("Accept: ") + type + "\r\n";
            const auto secure = isEncrypted ? Client::Tls::Yes : Client::Tls::No;
            Client first(mAddress, secure);
            const Reply before = first.ask("/dicom-web/" + kImage + target, accept);
            ASSERT_TRUE(before.status == 200 && before.isWhole);
            Client client(mAddress, secure, 65536);
            client.get("/dicom-web/" + kImage + target, accept);
            const Reply head = client.reply(Client::Body::StaysBehind);
            change();
            const Reply after = client.bodyAfter(head);
            EXPECT_EQ(after.isWhole, isWhole);
            EXPECT_EQ(after.body == before.body, isWhole);
            EXPECT_EQ(end(), 0);
        }
    }
}

}  // namespace
