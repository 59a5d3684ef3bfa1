#include "CommandLineFixture.h"
#include "support/CloudStore.h"

#include <gtest/gtest.h>

using namespace Kdd;

namespace
{

/// `kdd put` against a cloud storage of the test's own, without credentials.
class Put : public CommandLine
{
protected:
    Answer upload(const QString& path, const QByteArray& url) const
    {
        return kdd("put --json", QStringList{path, QString::fromLatin1(url)});
    }

    CloudStore store;
};

TEST_F(Put, UploadsAFileOfAnySize)
{
    for (const int size : {0, 1, 8 * 1024 * 1024, 9'000'001}) {
        const QByteArray content(size, 'x');
        const QByteArray object = "b/" + QByteArray::number(size);
        put("file", content);
        const Answer answer = upload(file("file"), "gs://" + object);
        EXPECT_EQ(answer.exitCode, 0) << answer.err.toStdString();
        EXPECT_EQ(answer.json("bytes"), size);
        EXPECT_TRUE(store.object(object) == content && !store.object(object).isNull()) << size;
    }
    EXPECT_TRUE(store.complaints().empty());
}

TEST_F(Put, LeavesNoObjectWhenTheFileCannotBeRead)
{
    const Answer answer = upload(QStringLiteral("/proc/self/mem"), "gs://b/o");
    EXPECT_EQ(answer.exitCode, 1);
    EXPECT_TRUE(answer.err.contains("/proc/self/mem was not uploaded to gs://b/o: "))
        << answer.err.toStdString();
    EXPECT_TRUE(store.object("b/o").isNull());
}

TEST_F(Put, NamesWhatKeptItFromUploading)
{
    put("file", "bytes");
    struct
    {
        QString path;
        const char* url;
        int exitCode;
        const char* reason;
    } const kCases[] = {{file("absent"), "gs://b/o", 1, "/absent: No such file"},
                        {images(), "gs://b/o", 1, "/images: "},
                        {file("file"), "https://a/b", 2, "https://a/b names no object of the cloud storage"},
                        {file("file"), "gs://b", 2, "gs://b names no object"},
                        {file("file"), "gs://b/o?x", 2, "gs://b/o?x has a \"?\""}};
    for (const auto& one : kCases) {
        const Answer answer = upload(one.path, one.url);
        EXPECT_EQ(answer.exitCode, one.exitCode);
        EXPECT_TRUE(answer.err.contains(one.reason)) << answer.err.toStdString();
    }
    EXPECT_TRUE(store.requests().empty());
    const CloudStore::Fault forbidden = {0, "403 Forbidden"};
    const std::vector<CloudStore::Fault> kFaults[] = {{forbidden}, {{}, forbidden}};
    for (const auto& faults : kFaults) {
        store.misbehave(faults);
        const Answer answer = upload(file("file"), "gs://b/o");
        EXPECT_EQ(answer.exitCode, 1);
        EXPECT_TRUE(answer.err.contains("/file was not uploaded to gs://b/o: HTTP code 403"))
            << answer.err.toStdString();
        EXPECT_EQ(answer.err.count("HTTP code 403"), 1) << answer.err.toStdString();
    }
    EXPECT_TRUE(store.object("b/o").isNull());
}

TEST_F(Put, WritesTheObjectOfThatNameOnly)
{
    put("file", "bytes");
    EXPECT_EQ(upload(file("file"), "gs://b/scan#1 a.dcm").exitCode, 0);
    EXPECT_EQ(store.object("b/scan%231%20a.dcm"), "bytes");
    EXPECT_TRUE(store.object("b/scan").isNull());
}

}  // namespace
