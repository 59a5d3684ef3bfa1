#include "server/retrieve/RetrieveFixture.h"

#include <dcmtk/dcmjpeg/djdecode.h>
#include <dcmtk/dcmjpls/djdecode.h>
#include <kddlib/FrameIndex.h>

using namespace Kdd;
using namespace Kdd::DicomWeb;

namespace
{

constexpr int kFrames = 3;

/// The pixels of a file, decoded by DCMTK.
QByteArray pixelsIn(const QByteArray& dicom, E_TransferSyntax& syntax)
{
    DcmFileFormat file;
    DcmElement* pixels = nullptr;
    if (readDicomBuffer(dicom, file).bad())
        return "unreadable";
    syntax = file.getDataset()->getOriginalXfer();
    if (file.getDataset()->chooseRepresentation(EXS_LittleEndianExplicit, nullptr).bad() ||
        file.getDataset()->findAndGetElement(DCM_PixelData, pixels).bad())
        return "not decoded";
    QByteArray bytes(static_cast<int>(pixels->getLength()), 0);
    pixels->getPartialValue(bytes.data(), 0, pixels->getLength());
    return bytes;
}

const E_TransferSyntax kWritten[] = {
    EXS_LittleEndianImplicit, EXS_LittleEndianExplicit, EXS_DeflatedLittleEndianExplicit,
    EXS_RLELossless,          EXS_JPEGProcess14SV1,     EXS_JPEGLSLossless};

class TransferSyntaxTest : public RetrieveTest
{
protected:
    TransferSyntaxTest()
    {
        DJDecoderRegistration::registerCodecs();
        DJLSDecoderRegistration::registerCodecs();
    }

    static QByteArray asked(E_TransferSyntax syntax)
    {
        return QByteArray("application/dicom; transfer-syntax=") + DcmXfer(syntax).getXferID();
    }

    const QByteArray mPixels = frameOf(0) + frameOf(1) + frameOf(2);
};

TEST_F(TransferSyntaxTest, IsTheOneThatIsAskedForWithAllPixelsAndCorrections)
{
    for (E_TransferSyntax stored : {EXS_LittleEndianExplicit, EXS_LittleEndianImplicit, EXS_BigEndianExplicit,
                                    EXS_DeflatedLittleEndianExplicit, EXS_RLELossless}) {
        add("a.dcm", anImageWithFrames(kFrames), stored);
        EXPECT_EQ(bodyOf(get(kInstance + "/frames/2", "application/octet-stream")), frameOf(1))
            << DcmXfer(stored).getXferName();
        EXPECT_EQ(bodyOf(get(kInstance + "/pixeldata", "application/octet-stream")), mPixels)
            << DcmXfer(stored).getXferName();
        correct(DCM_PatientName, "Right^Name");
        for (E_TransferSyntax wanted : kWritten) {
            Http::Response response = get(kInstance, asked(wanted));
            ASSERT_EQ(response.status, 200) << DcmXfer(wanted).getXferName();
            EXPECT_EQ(headerOf(response, "Content-Type"), asked(wanted));
            const QByteArray dicom = bodyOf(response);
            E_TransferSyntax given = EXS_Unknown;
            EXPECT_TRUE(pixelsIn(dicom, given) == mPixels)
                << DcmXfer(stored).getXferName() << " to " << DcmXfer(wanted).getXferName();
            EXPECT_EQ(given, wanted);
            EXPECT_EQ(nameIn(dicom), "Right^Name");
            EXPECT_EQ(dicom.size() % 2, 0);
        }
        QFile::remove(mStore.filePath("a.dcm"));
        correct(DCM_PatientName, "Wrong^Name");
    }
}

TEST_F(TransferSyntaxTest, OfPixelsThatAreNoneByTheirVrCanBeRead)
{
    add("a.dcm", anImage().data(DcmTag(DCM_PixelData, EVR_UN), mPixels));
    const QByteArray stored = fileContent(path("a.dcm"));
    const int at = stored.indexOf(QByteArray("\xe0\x7f\x10\x00UN", 6));
    // As numbers, whose length has two bytes.
    putFile(path("a.dcm"), QByteArray(stored).replace(at + 4, 8, "SL" + stored.mid(at + 8, 2)));
    correct(DCM_PatientName, "Right^Name");
    E_TransferSyntax given = EXS_Unknown;
    const QByteArray dicom = bodyOf(get(kInstance, asked(EXS_LittleEndianExplicit)));
    EXPECT_EQ(nameIn(dicom), "Right^Name");
    EXPECT_TRUE(pixelsIn(dicom, given) == mPixels);
}

TEST_F(TransferSyntaxTest, OfFramesIsThatOfTheObject)
{
    add("a.dcm", anImageWithFrames(kFrames));
    for (const char* type : {"image/jpeg", "image/jls", "image/dicom-rle"}) {
        const auto parts =
            partsOf(get(kInstance + "/frames/3,1", QByteArray("multipart/related; type=") + type));
        ASSERT_EQ(parts.size(), 2) << type;
        const QByteArray said = parts[0].first.mid(int(qstrlen("Content-Type: ")));
        EXPECT_TRUE(said.startsWith(QByteArray(type) + "; transfer-syntax=")) << said.constData();
        Http::Response instance = get(kInstance, "application/dicom" + said.mid(said.indexOf(';')));
        MemoryObject object(bodyOf(instance), {});
        FrameIndex index;
        QByteArray frame;
        ASSERT_TRUE(index.read(object).good()) << type;
        ASSERT_TRUE(index.readStored(object, 2, frame).good());
        EXPECT_EQ(parts[0].second, frame) << type;
        Http::Response alone = get(kInstance + "/frames/3", type);
        EXPECT_EQ(headerOf(alone, "Content-Type"), said);
        EXPECT_EQ(bodyOf(alone), frame) << type;
    }
}

TEST_F(TransferSyntaxTest, OfASeriesIsThatOfWhatCanHaveIt)
{
    add("a.dcm", anImageWithFrames(1));
    add("b.dcm", anImage("1.2.3.2"));
    Http::Response series =
        get("studies/1.2/series/1.2.3",
            "multipart/related; type=application/dicom; transfer-syntax=1.2.840.10008.1.2.4.80");
    EXPECT_EQ(series.status, 206) << "an object without pixels is not compressed";
    EXPECT_EQ(partsOf(series).size(), 1);
}

TEST_F(TransferSyntaxTest, OfDamagedPixelsIsGivenAsStoredOnly)
{
    add("a.dcm", anImageWithFrames(kFrames), EXS_RLELossless);
    QFile file(path("a.dcm"));
    ASSERT_TRUE(file.open(QIODevice::ReadWrite));
    const int at = file.readAll().lastIndexOf(QByteArray("\xfe\xff\x00\xe0", 4));
    file.seek(at + 8);
    file.write(QByteArray(64, '\x7f'));  // where the segments of the last frame begin
    file.close();
    for (E_TransferSyntax wanted : kWritten) {
        Http::Response response = get(kInstance, asked(wanted));
        const bool isKept = wanted == EXS_RLELossless;
        EXPECT_EQ(response.status, 200) << "the first frame is whole";
        EXPECT_EQ(bodyOf(response) == "broken off", !isKept) << DcmXfer(wanted).getXferName();
    }
    for (const char* type : {"application/octet-stream", "image/jls", "image/jpeg"}) {
        EXPECT_EQ(get(kInstance + "/frames/3", type).status, 500) << type;
        EXPECT_EQ(get(kInstance + "/frames/2", type).status, 200) << type;
    }
}

/// Bytes that tell the frame and the number, of different even lengths.
QByteArray fragmentOf(int frame, int number)
{
    QByteArray bytes = "frame " + QByteArray::number(frame) + " fragment " + QByteArray::number(number);
    bytes.append(frame % 7, '.');
    return bytes.append(bytes.size() % 2, '.');
}

enum class Table { None, Basic, Extended };

/// Frames of two fragments each.
DatasetBuilder aLongImage(int frames, Table table)
{
    QVector<QByteArray> parts = {{}};
    std::vector<Uint32> offsets;
    Uint32 offset = 0;
    for (int i = 0; i < 2 * frames; ++i) {
        parts.append(fragmentOf(i / 2, i % 2));
        if (i % 2 == 0)
            offsets.push_back(offset);
        offset += 8 + static_cast<Uint32>(parts.last().size());
    }
    DatasetBuilder image = anImageWithFrames(frames);
    if (table == Table::Basic)
        parts.first() =
            QByteArray(reinterpret_cast<const char*>(offsets.data()), static_cast<int>(4 * offsets.size()));
    if (table == Table::Extended) {
        const std::vector<Uint64> wide(offsets.begin(), offsets.end());
        auto* extended = new DcmOther64bitVeryLong(DcmTag(0x7fe0, 0x0001, EVR_OV));
        EXPECT_TRUE(extended->putUint64Array(wide.data(), wide.size()).good());
        image.with(extended);
    }
    return image.fragments(EXS_RLELossless, parts);
}

TEST_F(TransferSyntaxTest, FindsFramesByEitherTableOfOffsets)
{
    constexpr int kMany = 500;
    for (Table table : {Table::Basic, Table::Extended, Table::None}) {
        add("a.dcm", aLongImage(kMany, table), EXS_RLELossless);
        for (int frame : {0, 1, 249, 498, 499}) {
            const Http::Response response =
                get(kInstance + "/frames/" + QByteArray::number(frame + 1), "image/dicom-rle");
            const QByteArray expected = fragmentOf(frame, 0) + fragmentOf(frame, 1);
            EXPECT_EQ(response.status, table == Table::None ? 500 : 200);
            EXPECT_TRUE(table == Table::None || bodyOf(response) == expected) << frame;
        }
        EXPECT_EQ(get(kInstance + "/frames/501", "image/dicom-rle").status, 404);
        QFile::remove(mStore.filePath("a.dcm"));
    }
}

TEST_F(TransferSyntaxTest, OfVideosIsTheStoredOne)
{
    const QByteArray stream = QByteArray("\0\0\0\x18", 4) + "ftypmp42" + QByteArray(1000, 'v');
    DatasetBuilder image = anImageWithFrames(30);
    image.fragments(EXS_MPEG4HighProfileLevel4_1, {"", stream.left(500), stream.mid(500)});
    add("a.dcm", image, EXS_MPEG4HighProfileLevel4_1);
    for (const char* accept : {"video/mp4", "video/*", "application/octet-stream; transfer-syntax=*"}) {
        Http::Response frame = get(kInstance + "/frames/1", accept);
        EXPECT_EQ(headerOf(frame, "Content-Type"), "video/mp4; transfer-syntax=1.2.840.10008.1.2.4.102")
            << accept;
        EXPECT_EQ(bodyOf(frame), stream);
    }
    EXPECT_EQ(get(kInstance + "/frames/2").status, 404);
    EXPECT_EQ(get(kInstance + "/frames/1", "image/jpeg").status, 406);
    EXPECT_EQ(get(kInstance + "/frames/1", "application/octet-stream").status, 406);
    EXPECT_EQ(get(kInstance, "application/dicom").status, 406);
    EXPECT_EQ(get(kInstance, kStored).status, 200);
    Http::Response shown = get(kInstance + "/rendered", "video/mp4");
    EXPECT_EQ(headerOf(shown, "Content-Type"), "video/mp4");
    EXPECT_EQ(bodyOf(shown), stream);
    Http::Response part = get(kInstance + "/rendered", "video/*", "bytes=498-501");
    EXPECT_EQ(part.status, 206);
    EXPECT_EQ(bodyOf(part), stream.mid(498, 4));
    EXPECT_EQ(get(kInstance + "/rendered", "video/mpeg").status, 406);
    const Headers known = {{"accept", "video/mp4"}, {"if-none-match", headerOf(shown, "ETag")}};
    EXPECT_EQ(get(requestFor(kInstance + "/rendered", known)).status, 304);
}

}  // namespace
