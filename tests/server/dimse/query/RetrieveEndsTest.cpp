#include "QueriedArchive.h"
#include "support/LogCapture.h"

#include <dcmtk/dcmtls/tlsscu.h>
#include <gmock/gmock.h>

#include <thread>

using namespace Kdd;
using testing::HasSubstr;

namespace
{

/// Where objects go to, who is the destination "THERE", and how retrievals end.
class RetrieveEnds : public QueriedArchive
{
protected:
    ~RetrieveEnds() override
    {
        mDestination.kill();
        mDestination.waitForFinished(-1);
    }

    /// DCMTK's storescp, with options of its own.
    void startDestination(const QByteArray& options, const QStringList& more = {}, bool isSecure = false)
    {
        mThere = freePort();
        mSettings.dimse->rules.peers.insert("THERE", {{}, "127.0.0.1", mThere, isSecure, Dimse::kAllRights});
        QDir().mkpath(path("there"));
        mDestination.start(QStringLiteral("storescp"),
                           words("-od " + path("there").toUtf8() + ' ' + options) + more +
                               QStringList{QString::number(mThere)});
        while (!isListening(mThere))
            ASSERT_FALSE(mDestination.waitForFinished(20));
    }

    int taken() const { return QDir(path("there")).entryList(QDir::Files).size(); }

    /// Takes an object and goes on when somebody makes a file of that name, or the test has ended.
    void startWaitingFor(const char* file)
    {
        startDestination("--exec-sync -xcr",
                         {QStringLiteral("while [ -d %1 ] && [ ! -e %2 ]; do sleep 0.1; done")
                              .arg(path("there"), path(file))});
    }

    /// A retrieval that has given its first object to who waits for that file.
    std::unique_ptr<QProcess> beginMove()
    {
        auto process = begin("movescu", moving("THERE") + "-d", onLevel("STUDY", "StudyInstanceUID=1"));
        while (taken() == 0) {
            if (process->waitForFinished(20)) {
                ADD_FAILURE() << process->readAll().constData();
                break;
            }
        }
        return process;
    }

    quint16 mThere = 0;
    QProcess mDestination;
};

INSTANTIATE_TEST_SUITE_P(Engines, RetrieveEnds, testing::Values(Engine::Sqlite), engineName);

TEST_P(RetrieveEnds, SendsOverTlsToWhoseCertificateIsGood)
{
    const TlsFiles own;
    const TlsFiles theirs;
    const TlsFiles others;
    mSettings.dimse->tls = {own.certificate(), own.key(), theirs.certificate(), false};
    for (const bool isGood : {true, false}) {
        const TlsFiles& shown = isGood ? theirs : others;
        mDestination.kill();
        mDestination.waitForFinished(-1);
        startDestination("+tls " + shown.key() + ' ' + shown.certificate() + " +cf " + own.certificate(), {},
                         true);
        if (isGood)
            fill();
        else
            start();
        DcmTLSSCU asker("127.0.0.1", "KDD", port());
        asker.addTrustedCertFile(own.certificate().constData());
        OFList<OFString> syntaxes;
        syntaxes.push_back(UID_LittleEndianExplicitTransferSyntax);
        asker.addPresentationContext(UID_MOVEStudyRootQueryRetrieveInformationModel, syntaxes);
        ASSERT_TRUE(asker.initNetwork().good());
        ASSERT_TRUE(asker.negotiateAssociation().good());
        DcmDataset wanted;
        wanted.putAndInsertString(DCM_QueryRetrieveLevel, "STUDY");
        wanted.putAndInsertString(DCM_StudyInstanceUID, "1");
        OFList<RetrieveResponse*> answers;
        EXPECT_TRUE(asker.sendMOVERequest(1, "THERE", &wanted, &answers).good());
        ASSERT_FALSE(answers.empty());
        EXPECT_EQ(answers.back()->m_status, isGood ? 0 : 0xA702);
        EXPECT_EQ(taken(), 3);
        for (RetrieveResponse* answer : answers)
            delete answer;
        asker.releaseAssociation();
    }
}

TEST_P(RetrieveEnds, TheObjectThatIsBeingSentIsTheLastWhenTheServerStops)
{
    mSettings.dimse->stop = std::chrono::hours(1);
    startWaitingFor("go");
    fill();
    const auto moving = beginMove();
    std::thread stopping([this] { mServer->stop(); });
    while (isListening(port()))
        std::this_thread::yield();
    EXPECT_TRUE(QFile(path("go")).open(QIODevice::WriteOnly));
    stopping.join();
    EXPECT_TRUE(moving->waitForFinished(120000));
    const std::string said = moving->readAll().toStdString();
    EXPECT_THAT(said, HasSubstr("Warning: SubOperationsCompleteOneOrMoreFailures"));
    EXPECT_LT(taken(), 3);
}

TEST_P(RetrieveEnds, ADestinationThatAnswersNoMoreHoldsNoStopUp)
{
    mSettings.dimse->stop = std::chrono::milliseconds(100);
    mSettings.dimse->patience = std::chrono::hours(1);
    startWaitingFor("never");
    fill();
    const auto moving = beginMove();
    mServer->stop();
    EXPECT_TRUE(moving->waitForFinished(120000));
    EXPECT_EQ(mLog.count("Associations are broken off"), 1);
}

}  // namespace
