#include "kddlib/capi/FragmentLocation.h"
#include "kddlib/capi/kddstream.h"
#include "kddlib/net/dicom/DicomFileReader.h"
#include "platform/volume/FragmentReader.h"
#include "support/DatasetBuilder.h"
#include "support/FileContent.h"
#include "support/LogCapture.h"
#include "support/RealFiles.h"

#include <QtEndian>

#include <dcmtk/dcmdata/dcpxitem.h>
#include <gtest/gtest.h>

#include <sstream>

namespace Kdd
{
namespace
{

QByteArray item(const QByteArray& value)
{
    QByteArray bytes("\xfe\xff\x00\xe0????", 8);
    qToLittleEndian<quint32>(static_cast<quint32>(value.size()), bytes.data() + 4);
    return bytes + value;
}

/// DICOM files whose pixel data stand as they are given here.
class VideoInterface : public FileTest
{
protected:
    void SetUp() override { OFLog::configure(OFLogger::OFF_LOG_LEVEL); }

    DatasetBuilder movie() const { return anImage("1.2.9").with(DCM_CineRate, "25"); }

    void save(const DatasetBuilder& image, const QByteArray& items,
              E_TransferSyntax syntax = EXS_MPEG4HighProfileLevel4_1)
    {
        image.save(path(), syntax);
        const QByteArray pixelData("\xe0\x7f\x10\x00OB\x00\x00\xff\xff\xff\xff", 12);
        append(pixelData + items + QByteArray("\xfe\xff\xdd\xe0\0\0\0\0", 8));
    }

    void append(const QByteArray& bytes) const
    {
        QFile out(path());
        ASSERT_TRUE(out.open(QIODevice::Append) && out.write(bytes) == bytes.size());
    }

    /// The result, and as a text what comes with it; of a place in the file its bytes.
    std::pair<int, std::string> told() const
    {
        char uid[KDD_UID_SIZE] = "?";
        int32_t cineRate = -1, transferSyntax = -1;
        uint64_t offset = 1, length = 1;
        const int result = GetVideoMetaInfo(path().toLocal8Bit().constData(), uid, &cineRate, &transferSyntax,
                                            &offset, &length);
        const QByteArray bytes = content().mid(static_cast<int>(offset), static_cast<int>(length));
        std::ostringstream text;
        text << uid << ' ' << cineRate << "/s " << transferSyntax << ' ';
        text << (length == 0 ? "none at " + std::to_string(offset) : bytes.toStdString());
        return {result, text.str()};
    }
};

TEST_F(VideoInterface, IsToldFromWhatEncapsulatedVideosHold)
{
    constexpr auto kMpeg2 = EXS_MPEG2MainProfileAtMainLevel;
    const char kNothing[] = " 0/s 0 none at 0";
    const std::string video = "a video" + std::string(9999, 'v');
    const QByteArray asItem = item(QByteArray::fromStdString(video));
    const QByteArray tableThatLies = item({}).replace(4, 4, "\xff\xff\xff\x7f");
    const std::tuple<E_TransferSyntax, QByteArray, int, std::string> cases[] = {
        {EXS_MPEG4HighProfileLevel4_1, item({}) + asItem, KDD_READ, "1.2.9 25/s 102 " + video},
        {EXS_MPEG4HighProfileLevel4_1, item(QByteArray(4, '\0')) + asItem, KDD_READ,
         "1.2.9 25/s 102 " + video},
        {EXS_HEVCMainProfileLevel5_1, item({}) + item("one!") + item("two two!"), KDD_READ_PARTLY,
         "1.2.9 25/s 107 one!"},
        {EXS_JPEGProcess1, item({}) + item("jpeg"), KDD_NOT_READ, kNothing},
        {kMpeg2, item({}), KDD_NOT_READ, kNothing},
        {kMpeg2, {}, KDD_NOT_READ, kNothing},
        {kMpeg2, tableThatLies, KDD_NOT_READ, kNothing},
    };
    // The icon has pixel data of its own, before the video's.
    auto* const pixels = new DcmOtherByteOtherWord(DcmTag(DCM_PixelData, EVR_OW));
    pixels->putUint8Array(reinterpret_cast<const Uint8*>("icon"), 4);
    const DatasetBuilder withIcon = movie().withItem(DCM_IconImageSequence, anItem().with(pixels));
    for (const auto& [syntax, items, result, text] : cases) {
        SCOPED_TRACE(items.left(40).toHex().constData());
        const LogCapture log;
        save(withIcon, items, syntax);
        append(QByteArray("\xfc\xff\xfc\xffOB\0\0\x04\0\0\0????", 16));  // padding after the pixel data
        EXPECT_EQ(told(), std::pair(result, text));
        EXPECT_EQ(log.count("Could not find the video of " + path().toStdString()), result == KDD_NOT_READ);
    }
}

TEST_F(VideoInterface, NoPartOfAFileIsMistakenForItsVideo)
{
    save(movie(), item({}) + item("a video!"));
    const QByteArray whole = content();
    const LogCapture log;
    for (int size = 0; size < whole.size() - 16; ++size) {
        ASSERT_TRUE(QFile::resize(path(), size));
        ASSERT_EQ(told().first, KDD_NOT_READ) << size;
        putFile(path(), whole);
    }
}

TEST_F(VideoInterface, AUidThatDoesNotFitIsRefused)
{
    for (const int length : {64, 65}) {
        save(movie().with(DCM_SOPInstanceUID, QByteArray(length, '1')), item({}) + item("video!"));
        EXPECT_EQ(told().first, length == 64 ? KDD_READ : KDD_NOT_READ);
    }
}

/// The bytes of the first fragment as DCMTK reads them; empty when the file has none.
QByteArray firstFragment(DcmFileFormat& file)
{
    DcmElement* pixelData = nullptr;
    E_TransferSyntax xfer = EXS_Unknown;
    DcmPixelItem* fragment = nullptr;
    Uint8* bytes = nullptr;
    file.getDataset()->findAndGetElement(DCM_PixelData, pixelData);
    DcmPixelSequence* const sequence = pixelData != nullptr ? findFragments(*pixelData, xfer) : nullptr;
    if (sequence == nullptr || sequence->getItem(fragment, 1).bad() || fragment->getUint8Array(bytes).bad())
        return {};
    return QByteArray(reinterpret_cast<const char*>(bytes), static_cast<int>(fragment->getLengthField()));
}

TEST(FragmentLocation, IsThatOfEveryRealFile)
{
    if (realFilesFolder().isEmpty())
        GTEST_SKIP() << "KDD_TEST_DATA is not set";
    int compressed = 0;
    for (const char* folder : {"transfer-syntaxes", "multiframe", "odd/pixel-data"}) {
        for (const QString& path : realFiles(folder)) {
            DcmFileFormat file;
            FragmentLocation location;
            if (readDicomFile(path.toLocal8Bit().constData(), file).bad())
                continue;
            const bool isLocated = locateFirstFragment(path.toLocal8Bit().constData(), file, location);
            const QByteArray bytes = isLocated ? fileContent(path) : QByteArray();
            EXPECT_EQ(bytes.mid(static_cast<int>(location.offset), static_cast<int>(location.length)),
                      firstFragment(file))
                << path.toStdString();
            compressed += isLocated;
        }
    }
    EXPECT_GT(compressed, 50);
}

}  // namespace
}  // namespace Kdd
