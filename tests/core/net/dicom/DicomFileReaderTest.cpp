#include "kddlib/net/dicom/DicomFileReader.h"

#include "kddlib/Limits.h"
#include "kddlib/net/dicom/KxDcmFileLoader.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"
#include "support/FileContent.h"
#include "support/LogCapture.h"
#include "support/RealFiles.h"

#include <QtEndian>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcistrmb.h>
#include <dcmtk/dcmdata/dctk.h>
#include <gtest/gtest.h>

#include <memory>

using namespace Kdd;

extern "C" __attribute__((weak)) void __lsan_disable();
extern "C" __attribute__((weak)) void __lsan_enable();

namespace
{

/// A transfer syntax, with lengths or with delimiters.
struct Encoding
{
    const char* name;
    E_TransferSyntax xfer;
    bool hasLengths;
};

const Encoding kEncodings[] = {{"LittleEndian", EXS_LittleEndianExplicit, true},
                               {"LittleEndianDelimited", EXS_LittleEndianExplicit, false},
                               {"Implicit", EXS_LittleEndianImplicit, true},
                               {"BigEndianDelimited", EXS_BigEndianExplicit, false},
                               {"Deflated", EXS_DeflatedLittleEndianExplicit, true}};

/// Writes a dataset byte by byte: what nests so deep no library would write.
class DatasetBytes
{
public:
    explicit DatasetBytes(const Encoding& encoding)
        : mXfer(encoding.xfer)
        , mHasLengths(encoding.hasLengths)
    {
    }

    /// A sequence with an item that holds such a sequence, and so on, `depth` items in all.
    DatasetBytes& nest(quint16 group, quint16 element, int depth)
    {
        for (int left = depth; left > 0; --left) {
            number(group).number(element);
            if (mXfer.isExplicitVR())
                mBytes.append("SQ", 2).append(2, 0);
            const int header = mXfer.isExplicitVR() ? 12 : 8;
            length(left * 8 + (left - 1) * header);
            tag(0xe000);
            length((left - 1) * (8 + header));
        }
        for (int i = 0; i < depth && !mHasLengths; ++i)
            tag(0xe00d).number<quint32>(0).tag(0xe0dd).number<quint32>(0);
        return *this;
    }

    /// A file of the dataset.
    QByteArray file() const
    {
        QByteArray uid(mXfer.getXferID());
        uid.append(uid.size() % 2, 0);
        const QByteArray syntax = QByteArray("\2\0\20\0UI", 6) + char(uid.size()) + '\0' + uid;
        const QByteArray length = QByteArray("\2\0\0\0UL\4\0", 8) + char(syntax.size()) + QByteArray(3, 0);
        // A raw stream, without the frame of Qt's and of zlib's.
        const QByteArray deflated = qCompress(mBytes).mid(6).chopped(4);
        const bool isDeflated = mXfer.getStreamCompression() != ESC_none;
        return QByteArray(128, 0) + "DICM" + length + syntax + (isDeflated ? deflated : mBytes);
    }

private:
    template <typename T>
    DatasetBytes& number(T value)
    {
        const T ordered = mXfer.isBigEndian() ? qToBigEndian(value) : qToLittleEndian(value);
        mBytes.append(reinterpret_cast<const char*>(&ordered), sizeof ordered);
        return *this;
    }

    DatasetBytes& tag(quint16 element) { return number<quint16>(0xfffe).number(element); }

    void length(int bytes) { number(mHasLengths ? static_cast<quint32>(bytes) : 0xffffffffU); }

    DcmXfer mXfer;
    bool mHasLengths;
    QByteArray mBytes;
};

/// How many items the cache keeps inside each other; negative when it knows that there are more.
int depthOf(DcmDataset& dataset, const DcmTagKey& key)
{
    const std::unique_ptr<TagMap> map(TagMap::createTagMap(&dataset, kDefaultValueBound));
    int depth = 0;
    const TagElement* element = map->findElement(key);
    for (; element != nullptr && element->isSequence(); ++depth)
        element = static_cast<const TagSequence*>(element)->item(0)->findElement(key);
    return element != nullptr && element->markedAsOmitted() ? -depth : depth;
}

class DicomFileReader : public FileTest
{
protected:
    void SetUp() override { OFLog::configure(OFLogger::OFF_LOG_LEVEL); }

    OFCondition read(const QByteArray& bytes)
    {
        putFile(path(), bytes);
        return readDicomFile(path().toLocal8Bit().constData(), file);
    }

    DcmFileFormat file;
};

TEST_F(DicomFileReader, ReadsWhatDoesNotNestTooDeepAlsoFromACallersOwnStream)
{
    for (const Encoding& encoding : kEncodings) {
        SCOPED_TRACE(encoding.name);
        DatasetBytes twice(encoding);
        twice.nest(0x0008, 0x1140, kMaxItemDepth).nest(0x0040, 0x0275, kMaxItemDepth);
        EXPECT_STREQ(read(twice.file()).text(), "Normal");
        EXPECT_EQ(depthOf(*file.getDataset(), DCM_ReferencedImageSequence), kMaxItemDepth);
        EXPECT_EQ(depthOf(*file.getDataset(), DCM_RequestAttributesSequence), kMaxItemDepth);
        for (const int depth : {kMaxItemDepth, kMaxItemDepth + 1, 100000}) {
            const QByteArray bytes = DatasetBytes(encoding).nest(0x0008, 0x1140, depth).file();
            const bool isAllowed = depth == kMaxItemDepth;
            const char* const verdict = isAllowed ? "Normal" : "Sequence items are nested too deep";
            EXPECT_STREQ(read(bytes).text(), verdict);
            DcmInputBufferStream stream;
            stream.setBuffer(bytes.constData(), bytes.size());
            stream.setEos();
            EXPECT_STREQ(KxDcmFileLoader().read(stream).text(), verdict);
            EXPECT_EQ(stream.eos(), isAllowed);
        }
    }
}

TEST_F(DicomFileReader, DoesNotCountItemsBesideEachOther)
{
    DatasetBytes bytes(kEncodings[1]);
    for (int i = 0; i < 600; ++i)
        bytes.nest(0x0009, static_cast<quint16>(0x1000 + i), 1 + i % 7);
    EXPECT_TRUE(read(bytes.file()).good());
    EXPECT_EQ(file.getDataset()->card(), 600U);
    EXPECT_TRUE(read(bytes.file().chopped(1)).bad());
    EXPECT_TRUE(readDicomFile("/proc/no/such/file", file).bad());
}

TEST_F(DicomFileReader, LeavesTheSameBoundToDatasetsInMemory)
{
    DcmItem* item = file.getDataset();
    for (int i = 0; i <= kMaxItemDepth; ++i)
        ASSERT_TRUE(item->findOrCreateSequenceItem(DCM_ReferencedImageSequence, item, -2).good());
    const LogCapture log;
    EXPECT_EQ(depthOf(*file.getDataset(), DCM_ReferencedImageSequence), -kMaxItemDepth);
    EXPECT_EQ(log.count("Sequence (0008,1140) lies deeper than 256 items and is left out"), 1);
}

/// While it lives no memory counts as lost, where that is looked for.
struct LeaksOfOthers
{
    LeaksOfOthers()
    {
        if (__lsan_disable != nullptr)
            __lsan_disable();
    }
    ~LeaksOfOthers()
    {
        if (__lsan_enable != nullptr)
            __lsan_enable();
    }
};

/// One damaged file among many must not end the whole work.
TEST_F(DicomFileReader, RefusesADirectoryWhoseRecordTypeHasAWrongLength)
{
    if (realFilesFolder().isEmpty())
        GTEST_SKIP() << "KDD_TEST_DATA names no folder of DICOM files";
    QByteArray bytes = fileContent(realFiles("odd/dicomdir").first());
    const int at = bytes.indexOf(QByteArray("\x04\x00\x30\x14"
                                            "CS\x06\x00STUDY ",
                                            14));
    ASSERT_GT(at, 0);
    bytes[at + 6] = static_cast<char>(0xff);
    // Where the parser throws it lets go of what it was making.
    const LeaksOfOthers leaks;
    EXPECT_TRUE(read(bytes).bad());
}

}  // namespace
