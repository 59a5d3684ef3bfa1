#include "CatalogueFixture.h"
#include "kddlib/capi/kddstream.h"
#include "kddlib/capi/kddtagfile.h"
#include "support/HttpServer.h"
#include "support/LogCapture.h"
#include "support/ObjectServer.h"

#include <QFile>

#include <gtest/gtest.h>

#include <atomic>
#include <functional>
#include <thread>
#include <vector>

namespace Kdd
{
namespace
{

constexpr int kThreads = 8;
constexpr int kRounds = 20;

/// Runs the work on all threads at once, `round` counting from 0; how often it answered true.
int runOnAllThreads(const std::function<bool(int thread, int round)>& work)
{
    std::atomic<int> ready = 0, done = 0;
    std::vector<std::thread> threads;
    for (int thread = 0; thread < kThreads; ++thread) {
        threads.emplace_back([&, thread] {
            for (++ready; ready < kThreads;)
                std::this_thread::yield();
            for (int round = 0; round < kRounds; ++round)
                done += work(thread, round) ? 1 : 0;
        });
    }
    for (std::thread& thread : threads)
        thread.join();
    return done;
}

bool isStreamed(const std::string& url, const QByteArray& object)
{
    void* stream = nullptr;
    if (OpenStream(url.c_str(), &stream) != KDD_STREAM_OPENED)
        return false;
    QByteArray read(object.size(), '\0');
    const bool isWhole = ReadBytes(stream, read.data(), 0, read.size()) == read.size() && read == object;
    CloseStream(stream);
    return isWhole;
}

TEST(Threads, ReadStreamsAtOnce)
{
    const QByteArray object = someObject(300000);
    const NginxServer server;
    server.addFile("object", object);
    EXPECT_EQ(runOnAllThreads([&](int, int) { return isStreamed(server.url("object"), object); }),
              kThreads * kRounds);
}

/// Each thread removes images of its own from the one file or from its own.
class ThreadsAndTagFiles : public CatalogueFixture
{
protected:
    static QByteArray imageOf(int thread, int round)
    {
        return QByteArray::number(thread) + '.' + QByteArray::number(round);
    }

    static void write(const QByteArray& study, int firstThread, int lastThread)
    {
        std::vector<QByteArray> images;
        for (int thread = firstThread; thread <= lastThread; ++thread) {
            for (int round = 0; round <= kRounds; ++round)
                images.push_back(imageOf(thread, round));
        }
        writeStudy(study, images);
    }

    static bool removeImage(const QByteArray& study, int thread, int round)
    {
        const QByteArray image = imageOf(thread, round);
        const char* uids[] = {image.constData()};
        return DeleteImagesInTagFile(study.constData(), 1, uids);
    }

    bool isSynced(const QByteArray& study)
    {
        unsigned int size = 0;
        const char* data = nullptr;
        void* const handle = ReadAndSyncTagFileData(study.constData(), "", &size, &data);
        const bool isTagFile = QByteArray(data, static_cast<int>(size)).startsWith("TaCa");
        FreeTagFileData(handle);
        return handle != nullptr && isTagFile;
    }
};

TEST_F(ThreadsAndTagFiles, OfTheirOwnDoNotMeet)
{
    const auto study = [](int thread) { return "1." + QByteArray::number(thread); };
    for (int thread = 0; thread < kThreads; ++thread) {
        write(study(thread), thread, thread);
        registerImages(study(thread), {"kept"});
    }
    EXPECT_EQ(runOnAllThreads([&](int thread, int round) {
                  return removeImage(study(thread), thread, round) && isSynced(study(thread));
              }),
              kThreads * kRounds);
    for (int thread = 0; thread < kThreads; ++thread) {
        EXPECT_EQ(imagesInFile(study(thread)).size(), 1);
        EXPECT_TRUE(DeleteTagFile(study(thread).constData()));
    }
}

TEST_F(ThreadsAndTagFiles, OfOneStudyWaitForEachOther)
{
    write("1.2", 0, kThreads - 1);
    registerImages("1.2", {"kept"});
    // Whoever finds the file held for longer than it waits is told so, and nothing is lost.
    {
        const LogCapture log;
        const int removals =
            runOnAllThreads([](int thread, int round) { return removeImage("1.2", thread, round); });
        const int refused = log.count("Could not remove images from the tag file of study 1.2");
        EXPECT_EQ(removals, kThreads * kRounds - refused);
        EXPECT_EQ(imagesInFile("1.2").size(), kThreads + refused);
    }
    EXPECT_EQ(runOnAllThreads([this](int, int) { return isSynced("1.2"); }), kThreads * kRounds);
    const LogCapture log;
    const int deletions = runOnAllThreads([](int, int) { return DeleteTagFile("1.2"); });
    EXPECT_EQ(deletions, kThreads * kRounds - log.count("could not be deleted"));
    EXPECT_FALSE(QFile::exists(TagFile::cacheFilePathForStudy("1.2")));
}

}  // namespace
}  // namespace Kdd
