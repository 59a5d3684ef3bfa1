#include "kddlib/archive/DicomInput.h"

#include "kddlib/Limits.h"
#include "kddlib/archive/ReadInput.h"
#include "kddlib/tagmodel/TagMap.h"
#include "support/DatasetBuilder.h"
#include "support/FileContent.h"
#include "support/LogCapture.h"
#include "support/ObjectServer.h"
#include "support/RealFiles.h"
#include "support/TreeText.h"

#include <QUrl>
#include <QtEndian>

#include <gmock/gmock.h>

using namespace Kdd;

namespace
{

/// All that was read, but not where.
std::string textOf(const DicomInput& input)
{
    const std::string text = std::to_string(int(input.kind)) + ' ' + input.reason.toStdString() + '\n' +
                             input.studyUID.toStdString() + '\n' + input.seriesUID.toStdString() + '\n' +
                             std::to_string(input.stamp.size) + ' ' + std::to_string(input.fileBytes) + ' ' +
                             std::to_string(input.headerBytes) + '\n';
    return input.map != nullptr ? text + ownText(*input.map) : text;
}

// ---- files that are read without the parser

/// Whether the file is read without the parser; what then is said of it must be what the parser says.
bool isPlain(const QString& path)
{
    const QByteArray name = path.toLocal8Bit();
    DicomInput plain;
    if (!takePlain(name, readPlain(name, kDefaultValueBound), plain))
        return false;
    const LogCapture log;
    DicomInput ahead;
    EXPECT_TRUE(takePlain(name, PlainFiles({name}, 1, kDefaultValueBound).next(), ahead));
    DicomInput parsed = parseInput(name, Damage::Refused);
    for (const DicomInput* other : {&ahead, &parsed}) {
        EXPECT_EQ(textOf(plain), textOf(*other)) << name.constData();
        EXPECT_EQ(plain.path, other->path);
        EXPECT_EQ(plain.stamp.modified, other->stamp.modified) << name.constData();
    }
    EXPECT_TRUE(log.lines().empty()) << "of what is plain nothing is to be told";
    return true;
}

/// An element whose value is as long as it says, whatever it holds.
DcmElement* privateValue(Uint16 element, const QByteArray& bytes)
{
    auto* made = new DcmOtherByteOtherWord(DcmTag(0x0029, element, EVR_UN));
    made->putUint8Array(reinterpret_cast<const Uint8*>(bytes.constData()),
                        static_cast<unsigned long>(bytes.size()));
    return made;
}

/// Something of every kind that has a rule of its own.
DatasetBuilder aShortImageOfAllKinds()
{
    const DatasetBuilder inner = anItem().with(DCM_CodeValue, "113").with(DCM_CodeMeaning, "Odd");
    DatasetBuilder item = anItem().with(DCM_ReferencedSOPInstanceUID, "1.2.3");
    return anImage("1.2.3.4")
        .with(DCM_PatientName, "Doe^Jane")
        .with(DCM_PatientComments, "   ")
        .with(DCM_AccessionNumber, "")
        .with(DCM_PixelRepresentation, "1")
        .with(DcmTag(DCM_SmallestImagePixelValue, EVR_SS), "-5")
        .with(DCM_FrameIncrementPointer, "(0018,1063)")
        .with(DCM_RescaleSlope, "0.5")
        .with(DcmTag(0x0029, 0x0010, EVR_LO), "VENDOR A")
        .with(privateValue(0x1001, "abcd"))
        .withItem(DCM_ReferencedImageSequence, item.withItem(DCM_PurposeOfReferenceCodeSequence, inner))
        .withItem(DCM_ReferencedImageSequence, anItem())
        .withItem(DCM_VOILUTSequence, anItem().words({1, 2, 3, 4}, DCM_LUTData));
}

/// And of every length.
DatasetBuilder anImageOfAllKinds()
{
    DatasetBuilder image = aShortImageOfAllKinds();
    image.withLong(DCM_ImageComments, 3000).with(privateValue(0x1002, QByteArray(5000, 'x')));
    image.with(privateValue(0x1003, QByteArray(static_cast<int>(kDefaultValueBound), 'y')));
    Uint16 element = 0x1010;
    for (const int length : {900, 988, 990, 992})
        image.withItem(DcmTag(0x0029, element++, EVR_SQ), anItem().withLong(DCM_TextValue, length));
    return image.words(std::vector<Uint16>(600, 7), DcmTagKey(0x6000, 0x3000))
        .words(std::vector<Uint16>(5000, 1000));
}

struct Encoding
{
    const char* name;
    E_TransferSyntax xfer;
    E_EncodingType lengths;
    bool isPlain;
    bool isPlainWithSequences;  // that the dictionary does not know
};

const Encoding kEncodings[] = {
    {"Explicit", EXS_LittleEndianExplicit, EET_ExplicitLength, true, true},
    {"Delimited", EXS_LittleEndianExplicit, EET_UndefinedLength, true, true},
    {"Implicit", EXS_LittleEndianImplicit, EET_ExplicitLength, true, true},
    {"ImplicitDelimited", EXS_LittleEndianImplicit, EET_UndefinedLength, true, false},
    {"BigEndian", EXS_BigEndianExplicit, EET_ExplicitLength, false, false},
    {"Deflated", EXS_DeflatedLittleEndianExplicit, EET_ExplicitLength, false, false}};

class PlainInputFile : public FileTest
{
protected:
    QString save(const DatasetBuilder& image, E_TransferSyntax xfer, E_EncodingType lengths)
    {
        image.save(path(), xfer, lengths);
        return path();
    }
};

TEST_F(PlainInputFile, SaysWhatTheParserSays)
{
    for (const Encoding& encoding : kEncodings) {
        SCOPED_TRACE(encoding.name);
        EXPECT_EQ(isPlain(save(anImageOfAllKinds(), encoding.xfer, encoding.lengths)),
                  encoding.isPlainWithSequences);
        EXPECT_EQ(isPlain(save(anImage("1").bytes({1, 2}, DCM_PixelData), encoding.xfer, encoding.lengths)),
                  encoding.isPlain);
        const QByteArray whole = content();
        const int end = 144 + qFromLittleEndian<int>(whole.constData() + 140);
        putFile(path(), whole.left(end));
        EXPECT_FALSE(isPlain(path())) << "nothing follows the meta information";
    }
}

/// Whatever the damage is: what is taken all the same is what the parser takes.
TEST_F(PlainInputFile, IsLeftToTheParserWhenItIsDamaged)
{
    for (const Encoding& encoding : kEncodings) {
        SCOPED_TRACE(encoding.name);
        const QByteArray whole = fileContent(save(aShortImageOfAllKinds(), encoding.xfer, encoding.lengths));
        int taken = 0;
        for (int i = 132; i < whole.size() && encoding.isPlain && !HasFailure(); ++i) {
            QByteArray damaged = whole;
            damaged[i] = static_cast<char>(damaged.at(i) ^ "\x01\x20\x80"[i % 3]);
            putFile(path(), damaged);
            taken += isPlain(path()) ? 1 : 0;
            putFile(path(), whole.left(i));
            taken += isPlain(path()) ? 1 : 0;
        }
        EXPECT_TRUE(taken > 50 || !encoding.isPlain) << "values may be anything: " << taken;
    }
}

TEST_F(PlainInputFile, CountsFragmentsAndPassesOverThem)
{
    DatasetBuilder image = anImage("1.2");
    image.fragments(EXS_JPEGProcess14SV1, {0, 70000, 4, 3000});
    image.bytes({1, 2, 3, 4}, DCM_DataSetTrailingPadding);
    const QByteArray whole = fileContent(save(image, EXS_JPEGProcess14SV1, EET_UndefinedLength));
    EXPECT_TRUE(isPlain(path()));
    for (const int cut : {1, 15, 20, 3000, 4000, 73000}) {
        putFile(path(), whole.chopped(cut));
        EXPECT_FALSE(isPlain(path())) << cut;
    }
}

/// What lies behind its head is read later.
TEST_F(PlainInputFile, IsOfOneStateOfItsFile)
{
    const QByteArray description(20000, 'x');
    DatasetBuilder image = anImage("1.2");
    image.with(privateValue(0x1001, description)).bytes({1, 2}, DCM_PixelData);
    const QByteArray whole = fileContent(save(image, EXS_LittleEndianExplicit, EET_ExplicitLength));
    const QByteArray name = path().toLocal8Bit();
    FileHeads heads;
    heads.fetch({name, name + "absent"}, 0, 2);
    EXPECT_EQ(heads.source(1), nullptr);
    PlainImage taken;
    EXPECT_TRUE(readPlainFile(*heads.source(0), kDefaultValueBound, taken));
    EXPECT_EQ(heads.identity(0).size, whole.size());
    QFile::remove(path());
    EXPECT_FALSE(readPlainFile(*heads.source(0), kDefaultValueBound, taken));
    putFile(path(), whole);
    EXPECT_FALSE(readPlainFile(*heads.source(0), kDefaultValueBound, taken));
}

/// What a program told the parser counts.
TEST_F(PlainInputFile, IsNotReadWhenTheParserIsToReadOtherwise)
{
    save(anImage("1.2"), EXS_LittleEndianExplicit, EET_ExplicitLength);
    ASSERT_TRUE(isPlain(path()));
    dcmEnableAutomaticInputDataCorrection.set(OFFalse);
    EXPECT_FALSE(isPlain(path()));
    dcmEnableAutomaticInputDataCorrection.set(OFTrue);
}

TEST(PlainInputOfRealFiles, SaysWhatTheParserSays)
{
    if (realFilesFolder().isEmpty())
        GTEST_SKIP() << "KDD_TEST_DATA names no folder of DICOM files";
    int plain = 0;
    const QStringList files = realFiles("");
    for (const QString& file : files)
        plain += isPlain(file) ? 1 : 0;
    EXPECT_GT(2 * plain, files.size()) << "of which many are unusual on purpose";
}

// ---- objects that are read by ranges

/// Of what is read by ranges the same has to come as of a file with the same bytes.
class ObjectInput : public FileTest
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
        putFile(path(), content);
        expectSame(ObjectServer(content).url(), path());
        expectSame(ScriptedServer(httpResponse(content)).url("a"), path());
    }
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
