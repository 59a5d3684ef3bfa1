#include "CommandLineFixture.h"

using namespace Kdd;

namespace
{

using Serve = CommandLine;

TEST_F(Serve, TellsItsAddressesAndEndsWhenItIsAsked)
{
    const auto process = start("--json serve --listen [::1]:0 --status 127.0.0.1:0 --threads 1");
    const QByteArray told = toldBy(*process);
    EXPECT_EQ(textAt(told, "address").rfind("http://[::1]:", 0), 0U) << told.toStdString();
    EXPECT_EQ(textAt(told, "status").rfind("http://127.0.0.1:", 0), 0U) << told.toStdString();
    process->terminate();
    EXPECT_EQ(finish(*process).exitCode, 0);
}

TEST_F(Serve, ReceivesWithoutRequestsWhenThatIsAskedFor)
{
    const auto process = start("--json receive 127.0.0.1:0");
    const QString address = jsonAt(toldBy(*process), "dicom").toString();
    save("1", anImage("1"));
    QProcess sender;
    sender.start(QStringLiteral("storescu"),
                 {QStringLiteral("-aec"), QStringLiteral("KDD"), QStringLiteral("127.0.0.1"),
                  address.mid(address.lastIndexOf(QLatin1Char(':')) + 1), file("1")});
    EXPECT_EQ(finish(sender).exitCode, 0);
    process->terminate();
    EXPECT_EQ(finish(*process).exitCode, 0);
    EXPECT_EQ(imagesOf("1.2"), 1) << "it is in the tag file when the server has ended";
}

TEST_F(Serve, SaysWhyItDoesNotBegin)
{
    const std::tuple<const char*, int, const char*> kRefusals[] = {
        {"serve --listen 8042", 2, "\"8042\" is no address to listen at"},
        {"serve --listen 0.0.0.0:0", 1, "0.0.0.0:0 can be reached by other machines"},
        {"serve --access none.json", 2, "The access file cannot be followed: none.json: "},
        {"serve --tls-key key.pem", 2, "TLS takes both a certificate and a key"},
        {"serve --listen 127.0.0.1:0 --tls-cert none.pem --tls-key none.pem", 1, "none.pem: "},
        {"serve --listen 127.0.0.1:0 --viewer none", 1, "none: there is no viewer"},
        {"serve --listen 127.0.0.1:0 --public images", 1, "images is no public address"},
        {"serve --listen 127.0.0.1:0 --host a/b", 1, "a/b is no name of a host"},
        {"serve --listen 127.0.0.1:0 --dicom x", 2, "\"x\" is no address for associations"},
        {"serve --listen 127.0.0.1:0 --dicom 0.0.0.0:0", 1, "0.0.0.0:0 can be reached by other machines"},
        {"receive 0 --title SEVENTEEN-LETTERS", 2, "\"SEVENTEEN-LETTERS\" is no application entity title"},
        {"receive 0 --peers none.json", 2, "The peers file cannot be followed: none.json: "},
    };
    for (const auto& [arguments, exitCode, reason] : kRefusals) {
        const Answer answer = kdd(arguments);
        EXPECT_EQ(answer.exitCode, exitCode) << arguments;
        EXPECT_TRUE(answer.err.contains(reason)) << answer.err.toStdString();
        EXPECT_EQ(answer.out, "");
    }
}

}  // namespace
