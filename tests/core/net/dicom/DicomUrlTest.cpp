#include "kddlib/Loader.h"
#include "kddlib/items/kdditem.h"
#include "kddlib/net/KxCurlClient.h"
#include "kddlib/net/dicom/KxDcmFileLoader.h"
#include "support/DatasetBuilder.h"
#include "support/FileContent.h"
#include "support/HttpServer.h"
#include "support/LogCapture.h"

#include <QDateTime>
#include <QFile>
#include <QTemporaryDir>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctk.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <sstream>

using namespace Kdd;
using testing::HasSubstr;
using Mode = KxDcmFileLoader::Mode;

namespace
{

/// All attributes with all their values; or just why not all could be read.
std::string textOf(KxDcmFileLoader& loader, const OFCondition& condition)
{
    std::ostringstream text;
    text << condition.text() << '\n';
    if (condition.good())
        loader.getDataset()->print(text, DCMTypes::PF_shortenLongTagValues);
    return text.str();
}

std::string load(const std::string& name, Mode mode)
{
    KxDcmFileLoader loader(mode);
    return textOf(loader, loader.loadFile(name.c_str(), EXS_Unknown, EGL_noChange, 4096));
}

/// An image with a value that is longer than any window and a short one behind it, in a file that comes with the preamble.
class DicomUrl : public testing::Test
{
protected:
    DicomUrl()
    {
        image.save(QString::fromStdString(path()));
        bytes = fileContent(QString::fromStdString(path()));
    }
    ~DicomUrl() override
    {
        KxDcmFileLoader::setDefaultPort(nullptr);
        KxDcmFileLoader::setBearerToken(nullptr);
    }

    std::string path() const { return folder.filePath(QStringLiteral("a.dcm")).toStdString(); }

    /// The port of a server, as the storage servers have it.
    static std::string portOf(const ScriptedServer& server)
    {
        const std::string url = server.url("");
        return url.substr(url.rfind(':') + 1, url.rfind('/') - url.rfind(':') - 1);
    }

    QTemporaryDir folder;
    DatasetBuilder image = anImage("1")
                               .with(DCM_PatientName, "Doe^J")
                               .with(DCM_TextValue, std::string(3'000'000, 't').c_str())
                               .words({1, 2, 3, 4});
    QByteArray bytes;
};

TEST_F(DicomUrl, ReadsTheSameFromAPathAUrlAndAStorageServer)
{
    const ScriptedServer server(httpResponse(bytes));
    KxDcmFileLoader::setDefaultPort(portOf(server).c_str());
    KxDcmFileLoader::setBearerToken("secret");
    const std::string expected = load(path(), Mode::WholeLocal);
    EXPECT_THAT(expected, HasSubstr("Normal\n"));
    EXPECT_THAT(load(path(), Mode::BoundedLocal), HasSubstr("(not loaded)"));
    KxDcmFileLoader bounded(Mode::BoundedLocal);
    const OFCondition condition = bounded.loadFile(path().c_str());
    EXPECT_TRUE(bounded.readUntilEnd().good());
    EXPECT_EQ(textOf(bounded, condition), expected);
    EXPECT_EQ(load(path(), Mode::StorageServer), expected);  // which is no storage path
    EXPECT_EQ(load(server.url("a.dcm"), Mode::BoundedLocal), expected);
    EXPECT_THAT(server.requests().back().toStdString(), Not(HasSubstr("secret")));
    EXPECT_EQ(load("\\\\127.0.0.1\\share\\a.dcm", Mode::StorageServer), expected);
    EXPECT_THAT(server.requests().back().toStdString(), HasSubstr("GET /share/a.dcm "));
    EXPECT_THAT(server.requests().back().toStdString(), HasSubstr("\r\nAuthorization: Bearer secret\r\n"));
}

/// How servers say where the body ends, and how it breaks off: that a connection ends is all that some ever say.
const struct
{
    const char* name;
    QByteArray (*response)(const QByteArray& body);
    int mark;  // of the end [bytes]
    bool resets;
} kFramings[] = {
    {"a length", [](const QByteArray& body) { return httpResponse(body); }, 0, false},
    {"chunks", chunkedResponse, kEndOfChunks, false},
    {"the end of the connection", unmeasuredResponse, 0, false},
    {"a reset", unmeasuredResponse, 0, true},
};

TEST_F(DicomUrl, IsWholeOrFailsHoweverTheBodyEnds)
{
    const std::string expected = load(path(), Mode::WholeLocal);
    for (const auto& framing : kFramings) {
        std::atomic<int> lost{0};
        const ScriptedServer server([&](const QByteArray& /*request*/) {
            return ScriptedServer::Reply{
                framing.response(bytes).chopped(lost), {}, framing.resets && lost > 0};
        });
        EXPECT_EQ(load(server.url("a.dcm"), Mode::Default), expected) << framing.name;
        for (const int count : {0, 1, 131, 200, 340, 1000, 2'000'000, bytes.size() - 1}) {
            lost = bytes.size() - count + framing.mark;
            EXPECT_THAT(load(server.url("a.dcm"), Mode::Default), Not(HasSubstr("Normal\n")))
                << count << " bytes before " << framing.name;
        }
    }
}

TEST_F(DicomUrl, TellsOnceWhyItFailed)
{
    const ScriptedServer cut(httpResponse(bytes).chopped(1000));
    const ScriptedServer endless(chunkedResponse(bytes).chopped(kEndOfChunks));
    const ScriptedServer forbidden(httpResponse("no", "403 Forbidden"));
    const std::pair<std::string, std::string> kCases[] = {
        {"http://127.0.0.1:1/a", "Failed to connect"},
        {forbidden.url("a"), "HTTP response code 403"},
        {endless.url("a"), "transfer closed with outstanding"},
        {cut.url("a"), "transfer closed with 1000 bytes"}};
    for (const auto& [url, reason] : kCases) {
        const LogCapture log;
        EXPECT_TRUE(KxDcmFileLoader().loadFile(url.c_str()).bad());
        EXPECT_EQ(log.count("Reading " + url + " failed: " + reason), 1);
        EXPECT_EQ(Loader::loadDcmDataset(url.c_str(), 100), nullptr);
    }
}

TEST_F(DicomUrl, AValueThatWasLeftInAFileDoesNotComeFromAnother)
{
    for (const bool isReplaced : {false, true}) {
        KxDcmFileLoader loader(Mode::BoundedLocal);
        ASSERT_TRUE(loader.loadFile(path().c_str()).good());
        const QByteArray other = QByteArray(bytes).replace("tttt", "uuuu");
        QFile file(QString::fromStdString(path()));
        EXPECT_TRUE(!isReplaced || file.remove());
        ASSERT_TRUE(file.open(QIODevice::ReadWrite) && file.write(other) == other.size() && file.flush());
        // Else both may fall into one tick of the file system's clock.
        file.setFileTime(QDateTime::fromSecsSinceEpoch(isReplaced ? 1 : 2), QFile::FileModificationTime);
        file.close();
        OFString value;
        EXPECT_TRUE(loader.getDataset()->findAndGetOFStringArray(DCM_TextValue, value).bad());
        EXPECT_STREQ(loader.readUntilEnd().text(), "The file has changed since it was opened");
    }
}

TEST_F(DicomUrl, ALoaderTakesUrlsForPaths)
{
    const NginxServer server;
    server.addFile("1.2_0.dcm", bytes);
    OFString name;
    for (const int size : {-1, bytes.size()}) {
        const std::shared_ptr<Item> item = Loader::loadDcmDataset(server.url("1.2_0.dcm").c_str(), size);
        ASSERT_NE(item, nullptr) << size;
        EXPECT_TRUE(item->findAndGetOFString(DCM_PatientName, name).good());
        EXPECT_EQ(name, "Doe^J");
    }
    EXPECT_EQ(Loader::loadDcmDataset(server.url("1.2_0.dcm").c_str(), bytes.size() + 1), nullptr);
}

TEST(StoragePaths, BecomeUrls)
{
    const std::pair<const char*, const char*> paths[] = {
        {"\\\\filer\\share\\a\\b.dcm", "http://filer:90/share/a/b.dcm"},
        {"/Storage/filer/share/b.dcm", "http://filer:90/share/b.dcm"},
        {"\\Storage\\filer/x", "http://filer:90/x"},
        {"//filer/a b/scan#1.dcm", "http://filer:90/a%20b/scan%231.dcm"},
        {"/Storage/filer/\xc3\xbc%20?x=1", "http://filer:90/%C3%BC%20?x=1"},
        {"//[::1]/a", "http://[::1]:90/a"},
        {"//filer:80/a", ""},
        {"//user@filer/a", ""},
        {"//fi#ler/a", ""},
        {"/Storage/filer", ""},
        {"//filer", ""},
        {"/data/a.dcm", ""},
        {"///a", ""},
        {"", ""},
    };
    for (const auto& [path, expected] : paths) {
        std::string url = path;
        EXPECT_EQ(KxDcmFileLoader::convertPathToURL(url, "90"), *expected != 0) << path;
        EXPECT_EQ(url, *expected ? expected : path);
    }
    const LogCapture log;
    std::string usual = "//filer/a";
    EXPECT_TRUE(KxDcmFileLoader::convertPathToURL(usual, ""));
    EXPECT_EQ(usual, "http://filer:8181/a");
    EXPECT_EQ(KxDcmFileLoader::convertPathToExternalURL("//filer/a#b c"), KxCurlClient::url("a%23b%20c"));
    EXPECT_EQ(KxDcmFileLoader::convertPathToExternalURL("/data/a"), "");
}

}  // namespace
