#include "server/retrieve/RetrieveFixture.h"
#include "support/ObjectServer.h"

#include <QImage>

using namespace Kdd;
using namespace Kdd::DicomWeb;

namespace
{

const QByteArray kFrame = kInstance + "/frames/2";
const QByteArray kText = kInstance + "/bulkdata/0040A160";

class RemoteObjectTest : public RetrieveTest
{
protected:
    /// The image behind a server that answers as it should until it is spoiled.
    void serve()
    {
        write("a.dcm", anImageWithFrames(3).withLong(DCM_TextValue, 3000));
        mServer =
            std::make_unique<ObjectServer>(fileContent(path("a.dcm")), [this](ObjectServer::Answer& answer) {
                if (mSpoil)
                    mSpoil(answer);
            });
        add(path("a.dcm"), QByteArray::fromStdString(mServer->url()));
        QFile::remove(path("a.dcm"));
    }

    QVector<int> statuses()
    {
        QVector<int> all;
        for (const QByteArray& path : {kInstance, kFrame, kText, kInstance + "/rendered"})
            all.append(get(path).status);
        return all;
    }

    ObjectServer::Spoil mSpoil;
    std::unique_ptr<ObjectServer> mServer;
};

TEST_F(RemoteObjectTest, IsGivenByEveryResourceWithCorrections)
{
    serve();
    correct(DCM_PatientName, "Right^Name");
    for (const char* accept : {kStored, "application/dicom; transfer-syntax=1.2.840.10008.1.2.4.80"}) {
        EXPECT_EQ(nameIn(bodyOf(get(kInstance, accept))), "Right^Name") << accept;
    }
    EXPECT_EQ(bodyOf(get(kFrame, "application/octet-stream")), frameOf(1));
    EXPECT_EQ(bodyOf(get(kText)), QByteArray(3000, 'x'));
    EXPECT_EQ(bodyOf(get(kText, "*/*", "bytes=10-12")), "xxx");
    EXPECT_EQ(QImage::fromData(bodyOf(get(kFrame + "/rendered", "image/png"))).size(), QSize(16, 16));
}

TEST_F(RemoteObjectTest, IsRefusedWhenTheServerDoesNotGiveIt)
{
    serve();
    EXPECT_EQ(statuses(), QVector<int>({200, 200, 200, 200}));
    mSpoil = [](ObjectServer::Answer& answer) { answer.code = 404; };
    EXPECT_EQ(statuses().mid(0, 3), QVector<int>({500, 500, 500}))
        << "pictures are drawn from the whole object";
    mSpoil = [](ObjectServer::Answer& answer) { answer.total = "*"; };
    EXPECT_EQ(statuses().mid(0, 3), QVector<int>({500, 500, 500})) << "of unknown length";
}

/// What a server does to an object while it is read, and that nothing of it goes out as the object.
TEST_F(RemoteObjectTest, IsBrokenOffWhenItChangesWhileItIsSent)
{
    serve();
    const ObjectServer::Spoil spoils[] = {
        [](ObjectServer::Answer& answer) { answer.entityTag = "\"v2\""; },
        [](ObjectServer::Answer& answer) { answer.total = "99999999"; },
        [](ObjectServer::Answer& answer) { answer.body.chop(10); },
        [](ObjectServer::Answer& answer) { answer.code = 200; },
    };
    for (const ObjectServer::Spoil& spoil : spoils) {
        mSpoil = {};
        Http::Response frame = get(kFrame, "application/octet-stream");
        ASSERT_EQ(frame.status, 200);
        mSpoil = spoil;
        EXPECT_EQ(bodyOf(frame), "broken off");
    }
}

TEST_F(RemoteObjectTest, IsRefusedWhenItHoldsAnotherImage)
{
    write("b.dcm", anImageWithFrames(3, "1.2.3.2"));
    ObjectServer other(fileContent(path("b.dcm")));
    write("a.dcm", anImageWithFrames(3).withLong(DCM_TextValue, 3000));
    add(path("a.dcm"), QByteArray::fromStdString(other.url()));
    EXPECT_EQ(statuses(), QVector<int>({410, 410, 410, 410}));
}

}  // namespace
