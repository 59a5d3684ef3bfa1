#include "server/dimse/DimseFixture.h"

using namespace Kdd;

namespace
{

class DimseTls : public DimseFixture
{
protected:
    static QString text(const QByteArray& path) { return QString::fromLocal8Bit(path); }

    static QStringList showing(const TlsFiles& files)
    {
        return {QStringLiteral("+tls"), text(files.key()), text(files.certificate())};
    }

    TlsFiles mServerFiles;
    TlsFiles mPeerFiles;
};

TEST_F(DimseTls, TakesThoseWhoseCertificatesAreGood)
{
    const QStringList trusting = {QStringLiteral("+cf"), text(mServerFiles.certificate())};
    const QStringList unnamed = QStringList{QStringLiteral("+tla")} + trusting;
    const TlsFiles others;
    const struct
    {
        bool isRequired;
        QStringList options;
        bool isTaken;
    } kCallers[] = {{true, showing(mPeerFiles) + trusting, true},
                    {true, showing(others) + trusting, false},
                    {true, unnamed, false},
                    {true, {}, false},
                    {false, unnamed, true},
                    {false, showing(others) + trusting, false},
                    {false, {}, false}};
    const QString file = save(anImage(), "sent.dcm");
    for (const auto& caller : kCallers) {
        mSettings.dimse->tls = {mServerFiles.certificate(), mServerFiles.key(), mPeerFiles.certificate(),
                                caller.isRequired};
        mSettings.dimse->patience = std::chrono::seconds(2);
        start();
        const Said said = run("storescu", caller.options, {file});
        EXPECT_EQ(said.exitCode == 0, caller.isTaken)
            << caller.isRequired << caller.options.join(QLatin1Char(' ')).toStdString()
            << said.text.constData();
    }
    EXPECT_EQ(instances(), 1);
}

TEST_F(DimseTls, ShowsTheCertificateThatWasReadLast)
{
    const TlsFiles used;
    const auto take = [&](const TlsFiles& files) {
        QFile::remove(text(used.certificate()));
        QFile::remove(text(used.key()));
        return QFile::copy(text(files.certificate()), text(used.certificate())) &&
               QFile::copy(text(files.key()), text(used.key()));
    };
    const auto isShown = [&](const TlsFiles& files) {
        return run("echoscu", {QStringLiteral("+tla"), QStringLiteral("+cf"), text(files.certificate())})
                   .exitCode == 0;
    };
    ASSERT_TRUE(take(mServerFiles));
    mSettings.dimse->tls = {used.certificate(), used.key(), {}, false};
    start();
    EXPECT_TRUE(isShown(mServerFiles));
    ASSERT_TRUE(take(mPeerFiles));
    EXPECT_TRUE(mServer->renewCertificate().good());
    EXPECT_FALSE(isShown(mServerFiles));
    EXPECT_TRUE(isShown(mPeerFiles));
    QFile::remove(text(used.key()));
    EXPECT_TRUE(mServer->renewCertificate().bad());
    EXPECT_TRUE(isShown(mPeerFiles)) << "the former one stays";
}

}  // namespace
