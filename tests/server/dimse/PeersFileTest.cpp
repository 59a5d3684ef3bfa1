#include "server/PeersFile.h"

#include "support/FileContent.h"

#include <QTemporaryDir>

#include <gtest/gtest.h>

using namespace Kdd;

namespace
{

TEST(PeersFileTest, IsRefusedForEverySlipWithItsPlace)
{
    const std::pair<const char*, const char*> kSlips[] = {
        {"", "no JSON object"},
        {"[]", "no JSON object"},
        {"{}", "lets nobody in"},
        {R"({"anyone": []})", "lets nobody in"},
        {R"({"anyone": ["store"], "anyone": []})", "says something twice"},
        {R"({"anyone": "store"})", "anyone is no list of rights"},
        {R"({"anyone": ["read"]})", "anyone has a right that is none"},
        {R"({"anyone": ["store"], "peer": {}})", "peer is nothing that stands there"},
        {R"({"peers": []})", "peers is no object"},
        {R"({"peers": {"CT1": {}}})", "peers.CT1.rights is no list"},
        {R"({"peers": {"SEVENTEEN-LETTERS": {"rights": []}}})", "peers.SEVENTEEN-LETTERS is no application"},
        {R"({"peers": {"A\\B": {"rights": []}}})", "is no application entity title"},
        {R"({"peers": {"CT1": {"rights": [], "address": "10.0.0.7"}}})", "peers.CT1.address is nothing"},
        {R"({"peers": {"CT1": {"rights": [], "addresses": ["ct1"]}}})", "has something that is no numeric"},
        {R"({"peers": {"CT1": {"rights": [], "addresses": []}}})", "peers.CT1.addresses is empty"},
        {R"({"peers": {"CT1": {"rights": [], "host": "ct1"}}})", "peers.CT1.port is no port"},
        {R"({"peers": {"CT1": {"rights": [], "host": "ct1", "port": 70000}}})", "peers.CT1.port is no port"},
        {R"({"anyone": ["store"], "tls": {"certificate": "a"}})", "tls.key is no text"},
        {R"({"anyone": ["store"], "tls": {"certificate": "a", "key": "b", "required": true}})",
         "tls.caFile is needed"},
        {R"({"peers": {"WS1": {"rights": ["query"], "host": "ws1", "port": 104, "tls": true}}})",
         "tls.caFile is needed"},
        {R"({"peers": {"WS1": {"rights": ["query"], "studies": {}}}})", "peers.WS1.studies is no object"},
        {R"({"peers": {"WS1": {"rights": ["query"], "studies": {"PixelData": "A"}}}})", "are not kept apart"},
        {R"({"peers": {"WS1": {"rights": ["query"], "studies": {"PatientID": []}}}})", "without values"},
        {R"({"peers": {"WS1": {"rights": ["query"], "studies": {"PatientID": 7}}}})", "that is no text"},
        {R"({"anyone": [], "peers": {"WS1": {"rights": ["query"], "studies": {"PatientID": "A", "Foo": "B"}}}})",
         "are not kept apart"},
        {R"({"anyone": ["store"], "peers": {"WS1": {"rights": ["query"], "studies": {"PatientID": "A"}}}})",
         "no rights for anyone"},
        {R"({"anyone": ["store"], "unknownClasses": 1})", "unknownClasses is neither true nor false"},
    };
    for (const auto& [text, reason] : kSlips) {
        PeersFile file;
        const Result result = PeersFile::parse(text, file);
        EXPECT_TRUE(result.text().contains(QLatin1String(reason))) << text << result.text().toStdString();
        EXPECT_FALSE(file.rules.anyone || !file.rules.peers.isEmpty()) << "nothing of it is in force";
    }
}

TEST(PeersFileTest, IsOfOneMebibyteAtMost)
{
    const QTemporaryDir folder;
    const QString path = folder.filePath(QStringLiteral("peers.json"));
    const QByteArray text = R"({"anyone": ["store"]})";
    PeersFile file;
    putFile(path, text.leftJustified(1024 * 1024, ' '));
    EXPECT_TRUE(PeersFile::read(path, file).good());
    putFile(path, text.leftJustified(1024 * 1024 + 1, ' '));
    EXPECT_TRUE(PeersFile::read(path, file).text().contains(QLatin1String("too large")));
}

}  // namespace
