#include "kddlib/archive/DicomInput.h"
#include "kddlib/tagmodel/TagMap.h"
#include "support/DatasetBuilder.h"
#include "support/FileContent.h"
#include "support/LogCapture.h"
#include "support/ObjectServer.h"
#include "support/RealFiles.h"
#include "support/TreeText.h"

#include <QTemporaryDir>
#include <QUrl>

#include <gmock/gmock.h>

using namespace Kdd;

namespace
{

std::string textOf(const DicomInput& input)
{
    std::string text = std::to_string(int(input.kind)) + ' ' + input.reason.toStdString() + '\n' +
                       input.studyUID.toStdString() + '\n' + input.seriesUID.toStdString() + '\n' +
                       std::to_string(input.stamp.size) + ' ' + std::to_string(input.fileBytes) + ' ' +
                       std::to_string(input.headerBytes) + '\n';
    return input.map != nullptr ? text + ownText(*input.map) : text;
}

/// Of what is read by ranges the same has to come as of a file with the same bytes.
class ObjectInput : public testing::Test
{
protected:
    void expectSame(const std::string& url, const QString& path)
    {
        const LogCapture log;
        const DicomInput remote = readDicomInput(QByteArray::fromStdString(url), Damage::Refused);
        const DicomInput local = readDicomInput(path.toLocal8Bit(), Damage::Refused);
        EXPECT_EQ(remote.path.toStdString(), url);
        EXPECT_EQ(textOf(remote), textOf(local)) << url;
    }

    /// By a server that knows ranges and one that does not.
    void expectSame(const QByteArray& content)
    {
        putFile(mFolder.filePath(QStringLiteral("a")), content);
        expectSame(ObjectServer(content).url(), mFolder.filePath(QStringLiteral("a")));
        expectSame(ScriptedServer(httpResponse(content)).url("a"), mFolder.filePath(QStringLiteral("a")));
    }

    QTemporaryDir mFolder;
};

TEST_F(ObjectInput, IsWhatAFileOfTheSameBytesIs)
{
    // Longer than what comes with the first range, in the middle and at the end, and behind the pixels.
    const DatasetBuilder image =
        anImage("1.2.3")
            .with(DCM_PatientName, "Doe^J")
            .withLong(DCM_TextValue, 100'000)
            .withItem(DCM_VOILUTSequence, anItem().words(std::vector<Uint16>(40'000, 1), DCM_LUTData))
            .words(std::vector<Uint16>(100'000, 5))
            .bytes({1, 2, 3, 4}, DCM_DataSetTrailingPadding);
    for (const E_TransferSyntax xfer : {EXS_LittleEndianExplicit, EXS_LittleEndianImplicit,
                                        EXS_BigEndianExplicit, EXS_DeflatedLittleEndianExplicit})
        expectSame(image.file(xfer));
    const QByteArray whole = image.file();
    expectSame(whole.chopped(1));
    expectSame(whole.left(50'000));
    expectSame(whole.mid(132));
    expectSame("no image at all");
    expectSame(someObject(40'000));
}

TEST_F(ObjectInput, PassesOverFragmentsToTheLastOne)
{
    DatasetBuilder image = anImage("1.2");
    image.fragments(EXS_JPEGProcess14SV1, {0, 70000, 4, 3000});
    const QByteArray whole = image.file(EXS_JPEGProcess14SV1);
    expectSame(whole);
    for (const int cut : {1, 3000, 4000})
        expectSame(whole.chopped(cut));
}

TEST_F(ObjectInput, IsWhatTheFileIsForRealFiles)
{
    if (realFilesFolder().isEmpty())
        GTEST_SKIP() << "KDD_TEST_DATA names no folder of DICOM files";
    const NginxServer server(NginxServer::Scheme::Http,
                             "location /data/ { alias \"" + realFilesFolder().toLocal8Bit() + "/\"; }");
    const QStringList files = realFiles("");
    for (const QString& file : files) {
        const QByteArray name = QUrl::toPercentEncoding(file.mid(realFilesFolder().size() + 1), "/");
        expectSame(server.url("data/" + name.toStdString()), file);
    }
    EXPECT_GT(files.size(), 0);
}

/// One that cannot be had, wholly or in part, is never taken for something else.
TEST_F(ObjectInput, IsUnusableWhenItIsNotToBeHad)
{
    const auto read = [](const std::string& url) {
        const DicomInput input = readDicomInput(QByteArray::fromStdString(url), Damage::Refused);
        EXPECT_EQ(input.kind, DicomInput::Kind::Unusable) << url;
        return input.reason.toStdString();
    };
    EXPECT_EQ(read(ScriptedServer(httpResponse("no", "403 Forbidden")).url("a")), "HTTP response code 403");
    const QByteArray image =
        anImage("1").withLong(DCM_TextValue, 100'000).with(DCM_CodeValue, "1").file(EXS_BigEndianExplicit);
    EXPECT_THAT(read(ObjectServer(image,
                                  [](auto& answer) {
                                      if (answer.first > 0)
                                          answer.entityTag = "\"v2\"";
                                  })
                         .url()),
                testing::HasSubstr("changed"));
    EXPECT_EQ(read(ScriptedServer("HTTP/1.1 416 -\r\nContent-Range: bytes */0\r\n\r\n").url("a")),
              "The file is empty");
}

}  // namespace
