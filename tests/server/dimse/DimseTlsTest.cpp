#include "server/dimse/DimseFixture.h"
#include "support/FileContent.h"

using namespace Kdd;

namespace
{

class DimseTls : public DimseFixture
{
protected:
    static QByteArray showing(const TlsFiles& files)
    {
        return "+tls " + files.key() + ' ' + files.certificate();
    }

    TlsFiles mServerFiles;
    TlsFiles mPeerFiles;
};

TEST_F(DimseTls, TakesThoseWhoseCertificatesAreGood)
{
    const QByteArray trusting = " +cf " + mServerFiles.certificate();
    const QByteArray unnamed = "+tla" + trusting;
    const TlsFiles others;
    const std::tuple<bool, QByteArray, bool> kCallers[] = {{true, showing(mPeerFiles) + trusting, true},
                                                           {true, showing(others) + trusting, false},
                                                           {true, unnamed, false},
                                                           {true, {}, false},
                                                           {false, unnamed, true},
                                                           {false, showing(others) + trusting, false},
                                                           {false, {}, false}};
    const QString file = save(anImage(), "sent.dcm");
    for (const auto& [isRequired, options, isTaken] : kCallers) {
        mSettings.dimse->tls = {mServerFiles.certificate(), mServerFiles.key(), mPeerFiles.certificate(),
                                isRequired};
        mSettings.dimse->patience = std::chrono::seconds(2);
        start();
        const Said said = run("storescu", options, {file});
        EXPECT_EQ(said.exitCode == 0, isTaken) << isRequired << options.constData() << said.text.constData();
    }
    EXPECT_EQ(instances(), 1);
}

TEST_F(DimseTls, ShowsTheCertificateThatWasReadLast)
{
    const TlsFiles used;
    const auto take = [&](const TlsFiles& files) {
        putFile(QFile::decodeName(used.certificate()), fileContent(QFile::decodeName(files.certificate())));
        putFile(QFile::decodeName(used.key()), fileContent(QFile::decodeName(files.key())));
    };
    const auto isShown = [&](const TlsFiles& files) {
        return run("echoscu", "+tla +cf " + files.certificate()).exitCode == 0;
    };
    take(mServerFiles);
    mSettings.dimse->tls = {used.certificate(), used.key(), {}, false};
    start();
    EXPECT_TRUE(isShown(mServerFiles));
    take(mPeerFiles);
    EXPECT_TRUE(mServer->renewCertificate().good());
    EXPECT_FALSE(isShown(mServerFiles));
    EXPECT_TRUE(isShown(mPeerFiles));
    QFile::remove(QFile::decodeName(used.key()));
    EXPECT_TRUE(mServer->renewCertificate().bad());
    EXPECT_TRUE(isShown(mPeerFiles)) << "the former one stays";
}

}  // namespace
