#include "CommandLineFixture.h"
#include "support/CloudStore.h"

using namespace Kdd;

namespace
{

/// `kdd put` against a cloud storage of the test's own, without credentials.
class Put : public CommandLine
{
protected:
    Answer upload(const QString& path, const char* url = "gs://b/o") const
    {
        return kdd("put --json", QStringList{path, QLatin1String(url)});
    }

    CloudStore store;
};

TEST_F(Put, UploadsAFileOfAnySizeToTheObjectOfThatName)
{
    for (const int size : {0, 1, 8 * 1024 * 1024, 9'000'001}) {
        put("file", QByteArray(size, 'x'));
        const QByteArray name = QByteArray::number(size);
        const Answer answer = upload(file("file"), ("gs://b/scan#1 " + name).constData());
        EXPECT_EQ(answer.exitCode, 0) << answer.err.toStdString();
        EXPECT_EQ(answer.json("bytes"), size);
        const QByteArray object = store.object("b/scan%231%20" + name);
        EXPECT_TRUE(object == bytes("file") && !object.isNull()) << size;
    }
    EXPECT_TRUE(store.complaints().empty());
}

TEST_F(Put, LeavesNoObjectWhenItFailsAndNamesTheReasonOnce)
{
    put("file", "bytes");
    const CloudStore::Fault forbidden = {0, "403 Forbidden"};
    using Faults = std::vector<CloudStore::Fault>;
    const QString mem = QStringLiteral("/proc/self/mem");
    const std::tuple<QString, const char*, int, const char*, Faults> kCases[] = {
        {file("absent"), "gs://b/o", 1, "/absent: No such file", {}},
        {images(), "gs://b/o", 1, "/images: ", {}},
        {file("file"), "https://a/b", 2, "https://a/b names no object of the cloud storage", {}},
        {file("file"), "gs://b", 2, "gs://b names no object", {}},
        {file("file"), "gs://b/o?x", 2, "gs://b/o?x has a \"?\"", {}},
        {file("file"), "gs://b/o", 1, "/file was not uploaded to gs://b/o: HTTP code 403", {forbidden}},
        {file("file"), "gs://b/o", 1, "/file was not uploaded to gs://b/o: HTTP code 403", {{}, forbidden}},
        {mem, "gs://b/o", 1, "/proc/self/mem was not uploaded to gs://b/o: ", {}}};
    for (const auto& [from, url, exitCode, reason, faults] : kCases) {
        store.misbehave(faults);
        const Answer answer = upload(from, url);
        EXPECT_EQ(answer.exitCode, exitCode) << reason;
        EXPECT_EQ(answer.err.count(reason), 1) << answer.err.toStdString();
    }
    EXPECT_TRUE(store.object("b/o").isNull());
}

}  // namespace
