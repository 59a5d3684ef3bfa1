#include "kddlib/capi/FragmentLocation.h"
#include "kddlib/capi/kddstream.h"
#include "kddlib/net/DicomFileReader.h"
#include "platform/volume/FragmentReader.h"
#include "support/DatasetBuilder.h"
#include "support/LogCapture.h"
#include "support/RealFiles.h"

#include <QFile>
#include <QTemporaryDir>
#include <QtEndian>

#include <dcmtk/dcmdata/dcpxitem.h>
#include <gtest/gtest.h>

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

QByteArray contentOf(const QString& path)
{
    QFile file(path);
    EXPECT_TRUE(file.open(QIODevice::ReadOnly));
    return file.readAll();
}

struct Told
{
    int result = 0;
    char sopInstanceUID[KDD_UID_SIZE] = "?";
    int32_t cineRate = -1;
    int32_t transferSyntax = -1;
    uint64_t offset = 1;
    uint64_t length = 1;
};

/// DICOM files whose pixel data stand as they are given here.
class VideoInterface : public testing::Test
{
protected:
    void SetUp() override { OFLog::configure(OFLogger::OFF_LOG_LEVEL); }

    DatasetBuilder movie() const { return anImage("1.2.9").with(DCM_CineRate, "25"); }

    void save(const DatasetBuilder& image, const QByteArray& items,
              E_TransferSyntax syntax = EXS_MPEG4HighProfileLevel4_1)
    {
        DcmFileFormat file(&image.dataset());
        ASSERT_TRUE(file.saveFile(path().toLocal8Bit().constData(), syntax).good());
        const QByteArray pixelData("\xe0\x7f\x10\x00OB\x00\x00\xff\xff\xff\xff", 12);
        append(pixelData + items + QByteArray("\xfe\xff\xdd\xe0\0\0\0\0", 8));
    }

    void append(const QByteArray& bytes) const
    {
        QFile out(path());
        ASSERT_TRUE(out.open(QIODevice::Append) && out.write(bytes) == bytes.size());
    }

    Told ask() const
    {
        Told told;
        told.result = GetVideoMetaInfo(path().toLocal8Bit().constData(), told.sopInstanceUID, &told.cineRate,
                                       &told.transferSyntax, &told.offset, &told.length);
        return told;
    }

    QByteArray toldBytes(const Told& told) const
    {
        return contentOf(path()).mid(static_cast<int>(told.offset), static_cast<int>(told.length));
    }

    QString path() const { return mFolder.filePath(QStringLiteral("video.dcm")); }

    QTemporaryDir mFolder;
};

TEST_F(VideoInterface, IsWhereItIsToldWithAndWithoutAnOffsetTable)
{
    const QByteArray video = "a video" + QByteArray(9999, 'v');
    for (const QByteArray& table : {QByteArray(), QByteArray(4, '\0')}) {
        save(movie(), item(table) + item(video));
        append(QByteArray("\xfc\xff\xfc\xffOB\0\0\x04\0\0\0????", 16));  // padding after the pixel data
        const Told told = ask();
        EXPECT_EQ(told.result, KDD_READ);
        EXPECT_STREQ(told.sopInstanceUID, "1.2.9");
        EXPECT_EQ(told.cineRate, 25);
        EXPECT_EQ(told.transferSyntax, 102);
        EXPECT_EQ(toldBytes(told), video);
    }
}

TEST_F(VideoInterface, OfSeveralFragmentsTheFirstIsToldAndLeadsToTheOthers)
{
    // The icon has pixel data of its own, before the video's.
    auto* const pixels = new DcmOtherByteOtherWord(DcmTag(DCM_PixelData, EVR_OW));
    pixels->putUint8Array(reinterpret_cast<const Uint8*>("icon"), 4);
    const DatasetBuilder withIcon = movie().withItem(DCM_IconImageSequence, anItem().with(pixels));
    save(withIcon, item({}) + item("one!") + item("two two!"), EXS_HEVCMainProfileLevel5_1);
    const Told told = ask();
    EXPECT_EQ(told.result, KDD_READ_PARTLY);
    EXPECT_EQ(told.transferSyntax, 107);
    EXPECT_EQ(toldBytes(told), "one!");
    EXPECT_EQ(contentOf(path()).mid(static_cast<int>(told.offset + told.length), 16), item("two two!"));
}

TEST_F(VideoInterface, WhatIsNoVideoGivesNothing)
{
    const QByteArray tableThatLies = item({}).replace(4, 4, "\xff\xff\xff\x7f");
    const std::pair<E_TransferSyntax, QByteArray> cases[] = {
        {EXS_JPEGProcess1, item({}) + item("jpeg")},
        {EXS_MPEG2MainProfileAtMainLevel, item({})},
        {EXS_MPEG2MainProfileAtMainLevel, {}},
        {EXS_MPEG2MainProfileAtMainLevel, tableThatLies},
    };
    for (const auto& [syntax, items] : cases) {
        SCOPED_TRACE(items.toHex().constData());
        const LogCapture log;
        save(movie(), items, syntax);
        const Told told = ask();
        EXPECT_EQ(told.result, KDD_NOT_READ);
        EXPECT_STREQ(told.sopInstanceUID, "");
        EXPECT_TRUE(told.cineRate == 0 && told.transferSyntax == 0 && told.offset == 0 && told.length == 0);
        EXPECT_EQ(log.count("Could not find the video of " + path().toStdString()), 1);
    }
}

TEST_F(VideoInterface, NoPartOfAFileIsMistakenForItsVideo)
{
    save(movie(), item({}) + item("a video!"));
    const QByteArray whole = contentOf(path());
    const LogCapture log;
    for (int size = 0; size < whole.size() - 16; ++size) {
        ASSERT_TRUE(QFile::resize(path(), size));
        ASSERT_EQ(ask().result, KDD_NOT_READ) << size;
        QFile again(path());
        ASSERT_TRUE(again.open(QIODevice::WriteOnly) && again.write(whole) == whole.size());
    }
}

TEST_F(VideoInterface, AUidThatDoesNotFitIsRefused)
{
    for (const int length : {64, 65}) {
        save(movie().with(DCM_SOPInstanceUID, QByteArray(length, '1').constData()),
             item({}) + item("video!"));
        EXPECT_EQ(ask().result, length == 64 ? KDD_READ : KDD_NOT_READ);
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
            const QByteArray fragment = firstFragment(file);
            EXPECT_EQ(isLocated, !fragment.isEmpty()) << path.toStdString();
            compressed += isLocated;
            EXPECT_TRUE(!isLocated || contentOf(path).mid(static_cast<int>(location.offset),
                                                          static_cast<int>(location.length)) == fragment)
                << path.toStdString();
        }
    }
    EXPECT_GT(compressed, 50);
}

}  // namespace
}  // namespace Kdd
