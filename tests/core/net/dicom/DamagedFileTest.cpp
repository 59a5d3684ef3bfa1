#include "kddlib/net/dicom/DamagedFile.h"

#include "kddlib/net/dicom/DicomFileReader.h"
#include "support/DatasetBuilder.h"
#include "support/FileContent.h"

#include <QTemporaryDir>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace Kdd
{
namespace
{

const QByteArray kItem("\xfe\xff\x00\xe0\xff\xff\xff\xff", 8);
const QByteArray kItemEnd("\xfe\xff\x0d\xe0\0\0\0\0", 8);
const QByteArray kSequenceEnd("\xfe\xff\xdd\xe0\0\0\0\0", 8);
const QByteArray kOpenPixels("\xe0\x7f\x10\x00OB\0\0\xff\xff\xff\xff", 12);
const QByteArray kOffsets("\xfe\xff\x00\xe0\0\0\0\0", 8);
const QByteArray kFragment("\xfe\xff\x00\xe0\x02\0\0\0ab", 10);

/// A file with a sequence before the UIDs of study and series and a long text behind them.
QByteArray soundFile(E_EncodingType lengths = EET_UndefinedLength)
{
    QTemporaryDir folder;
    const QString path = folder.filePath(QStringLiteral("sound"));
    DatasetBuilder image = anImage("1");
    image.withItem(DCM_ReferencedStudySequence, anItem().with(DCM_PatientID, "inside"));
    image.withLong(DCM_TextValue, 2000);
    DcmFileFormat file(&image.dataset());
    EXPECT_TRUE(
        file.saveFile(path.toLocal8Bit().constData(), EXS_LittleEndianExplicit, lengths, EGL_withoutGL)
            .good());
    return fileContent(path);
}

QByteArray declaredAsRle(QByteArray file)
{
    return file.replace(QByteArray("1.2.840.10008.1.2.1\0", 20), QByteArray("1.2.840.10008.1.2.5\0", 20));
}

QByteArray withNativePixels(int bytes)
{
    QByteArray file = soundFile();
    file +=
        QByteArray("\x28\x00\x02\x00US\x02\0\x01\0", 10) + QByteArray("\x28\x00\x10\x00US\x02\0\x02\0", 10) +
        QByteArray("\x28\x00\x11\x00US\x02\0\x02\0", 10) + QByteArray("\x28\x00\x00\x01US\x02\0\x08\0", 10);
    return file + QByteArray("\xe0\x7f\x10\x00OB\0\0", 8) + char(bytes) + QByteArray(3, 0) +
           QByteArray(bytes, 'x');
}

struct Damage
{
    const char* name;
    QByteArray file;
    const char* leftOut;
    const char* found;  // of sequence, text and pixels
};

const QByteArray kInside("LO\6\0inside", 10);
const QByteArray kTooLong("LO\xff\xffinside", 10);
const QByteArray kFragments = declaredAsRle(soundFile()) + kOpenPixels + kOffsets;

const Damage kDamages[] = {
    {"CutInTheLastValue", soundFile().chopped(100), "(0040,a160) and what follows from byte", "S"},
    {"CutInAHead", soundFile() + "\x50\x00\x10", "what follows from byte", "ST"},
    {"Garbage", soundFile() + "<!-- what a mailer appended -->", "and what follows from byte", "ST"},
    {"Zeros", soundFile() + QByteArray(21, 0), "what follows from byte", "ST"},
    {"ItemWithoutEnd", soundFile().replace(kItemEnd, ""), "(0008,1110)", "T"},
    {"ItemEndsTheSequence", soundFile().replace(kSequenceEnd, ""), "(0008,1110)", "T"},
    {"LengthInsideIsTooLong", soundFile(EET_ExplicitLength).replace(kInside, kTooLong), "(0008,1110)", "T"},
    {"PixelsAreNotCompressed", declaredAsRle(withNativePixels(4)), "the declared compression", "STP"},
    {"PixelsAreNeither", declaredAsRle(withNativePixels(6)), "(7fe0,0010)", "ST"},
    {"FragmentIsCut", kFragments + kFragment + kFragment.chopped(1), "the end of (7fe0,0010)", "STP"},
    {"OnlyFragmentIsCut", kFragments + kFragment.chopped(1), "(7fe0,0010)", "ST"},
};

class DamagedFile : public FileTest
{
protected:
    QByteArray put(const QByteArray& content) const
    {
        putFile(path(), content);
        return path().toLocal8Bit();
    }
};

TEST_F(DamagedFile, GivesWhatIsSoundAndTellsTheRest)
{
    for (const Damage& damage : kDamages) {
        const QByteArray path = put(damage.file);
        DcmFileFormat file;
        QString leftOut;
        EXPECT_TRUE(readDicomFile(path.constData(), file).bad()) << damage.name;
        ASSERT_TRUE(readDamagedDicomFile(path.constData(), file, leftOut).good()) << damage.name;
        EXPECT_THAT(leftOut.toStdString(), testing::HasSubstr(damage.leftOut)) << damage.name;
        DcmDataset& dataset = *file.getDataset();
        EXPECT_TRUE(dataset.tagExistsWithValue(DCM_StudyInstanceUID)) << damage.name;
        std::string found;
        for (const auto& [key, letter] :
             {std::pair(DCM_ReferencedStudySequence, 'S'), {DCM_TextValue, 'T'}, {DCM_PixelData, 'P'}})
            found += dataset.tagExists(key) ? std::string(1, letter) : "";
        EXPECT_EQ(found, damage.found) << damage.name;
    }
}

TEST_F(DamagedFile, IsRefusedAsBeforeWhereverItIsCutBeforeItNamesItself)
{
    const QByteArray sound = soundFile();
    DcmFileFormat file;
    QString leftOut;
    int taken = 0;
    for (int length = 0; length < sound.size(); length += length < 500 ? 1 : 301) {
        const QByteArray path = put(sound.left(length));
        const bool isTaken = readDicomFile(path.constData(), file).bad() &&
                             readDamagedDicomFile(path.constData(), file, leftOut).good();
        taken += isTaken ? 1 : 0;
        EXPECT_TRUE(!isTaken || file.getDataset()->tagExistsWithValue(DCM_SeriesInstanceUID)) << length;
    }
    EXPECT_GT(taken, 4) << "the long text";
    EXPECT_TRUE(readDamagedDicomFile(put(sound).constData(), file, leftOut).good());
    EXPECT_TRUE(leftOut.isEmpty()) << "nothing is wrong with it";
}

}  // namespace
}  // namespace Kdd
