#include "kddlib/items/FrameIndex.h"

#include "support/DatasetBuilder.h"
#include "support/RealImage.h"

#include <QTemporaryDir>
#include <QtEndian>

#include <dcmtk/dcmdata/dccodec.h>
#include <dcmtk/dcmdata/dcpixseq.h>
#include <dcmtk/dcmdata/dcpxitem.h>
#include <dcmtk/dcmdata/dcrledrg.h>
#include <dcmtk/dcmjpeg/djdecode.h>
#include <dcmtk/dcmjpls/djdecode.h>

#include <set>

using namespace Kdd;

namespace
{

/// The fragments of a frame as DCMTK finds them; null where it cannot.
QByteArray fragmentsByDcmtk(DcmPixelSequence& sequence, int frame, int frames)
{
    Uint32 first = 0;
    Uint32 behind = static_cast<Uint32>(sequence.card());
    if (DcmCodec::determineStartFragment(static_cast<Uint32>(frame), frames, &sequence, first).bad())
        return {};
    if (frame + 1 < frames &&
        DcmCodec::determineStartFragment(static_cast<Uint32>(frame + 1), frames, &sequence, behind).bad())
        return {};
    QByteArray bytes;
    for (Uint32 i = first; i < behind; ++i) {
        DcmPixelItem* item = nullptr;
        Uint8* value = nullptr;
        sequence.getItem(item, i);
        item->getUint8Array(value);
        bytes.append(reinterpret_cast<const char*>(value), static_cast<int>(item->getLength()));
    }
    return bytes;
}

/// The pixels that DCMTK decodes, all frames; null where it has no decoder.
QByteArray decodedByDcmtk(DcmDataset& dataset)
{
    static const bool once = [] {
        DJDecoderRegistration::registerCodecs();
        DJLSDecoderRegistration::registerCodecs();
        DcmRLEDecoderRegistration::registerCodecs();
        return true;
    }();
    DcmElement* pixels = nullptr;
    if (!once || dataset.chooseRepresentation(EXS_LittleEndianExplicit, nullptr).bad() ||
        dataset.findAndGetElement(DCM_PixelData, pixels).bad())
        return {};
    QByteArray bytes(static_cast<int>(pixels->getLength()), 0);
    return pixels->getPartialValue(bytes.data(), 0, pixels->getLength()).good() ? bytes : QByteArray();
}

class RealFrames : public RealImages
{
protected:
    template <typename Test>
    static void forEach(const Test& test)
    {
        RealImages::forEach({"transfer-syntaxes", "multiframe"}, test);
    }
};

TEST_F(RealFrames, HaveTheFragmentsThatDcmtkFinds)
{
    int compared = 0;
    forEach([&](const QString& /*path*/, RealImage& real) {
        DcmElement* element = nullptr;
        if (!real.index.isEncapsulated())
            return;
        ASSERT_TRUE(real.file.getDataset()->findAndGetElement(DCM_PixelData, element).good());
        auto& pixels = static_cast<DcmPixelData&>(*element);
        E_TransferSyntax xfer = EXS_Unknown;
        const DcmRepresentationParameter* parameter = nullptr;
        DcmPixelSequence* sequence = nullptr;
        pixels.getOriginalRepresentationKey(xfer, parameter);
        if (pixels.getEncapsulatedRepresentation(xfer, parameter, sequence).bad())
            return;
        for (int frame = 0; frame < real.index.frames(); ++frame) {
            const QByteArray expected = fragmentsByDcmtk(*sequence, frame, real.index.frames());
            QByteArray stored;
            ASSERT_TRUE(real.index.readStored(real.source, frame, stored).good());
            EXPECT_TRUE(expected.isNull() || stored == expected) << "frame " << frame;
            compared += expected.isNull() ? 0 : 1;
        }
    });
    EXPECT_GT(compared, 400);
}

/// Files whose frames are not all what DCMTK makes of them: bits beyond the stored ones are cut off here, and one frame
/// is smaller than its image.
bool isDecodedOtherwise(const QString& path)
{
    return path.endsWith(QLatin1String("JLSL_16_15_1_1F.dcm")) ||
           path.endsWith(QLatin1String("multiframe/sc/multiframe.dcm"));
}

TEST_F(RealFrames, AreDecodedAsByDcmtk)
{
    std::set<QByteArray> syntaxes;
    int files = 0;
    forEach([&](const QString& path, RealImage& real) {
        FrameIndex& index = real.index;
        if (!index.isEncapsulated() || !index.canDecode() || index.decodedBits() % 8 != 0 ||
            isDecodedOtherwise(path))
            return;
        const QByteArray expected = decodedByDcmtk(*real.file.getDataset());
        if (expected.isNull())
            return;
        const auto size = static_cast<int>(index.decodedBits() / 8);
        for (int frame = 0; frame < index.frames(); ++frame) {
            QByteArray decoded;
            ASSERT_TRUE(index.readDecoded(real.source, frame, decoded).good());
            EXPECT_TRUE(decoded == expected.mid(frame * size, size)) << "frame " << frame;
        }
        ++files;
        syntaxes.insert(index.transferSyntaxUID());
    });
    EXPECT_GT(files, 40);
    EXPECT_GE(syntaxes.size(), 7U);
}

TEST_F(RealFrames, AreThoseOfTheValueWhereNothingIsCompressed)
{
    int compared = 0;
    forEach([&](const QString& /*path*/, RealImage& real) {
        DcmElement* element = nullptr;
        const qint64 bits = real.index.decodedBits();
        DcmDataset& dataset = *real.file.getDataset();
        EXPECT_EQ(real.index.hasPixels(), dataset.tagExists(DCM_PixelData) ||
                                              dataset.tagExists(DCM_FloatPixelData) ||
                                              dataset.tagExists(DCM_DoubleFloatPixelData));
        if (real.index.isEncapsulated() || !real.index.hasPixels() || bits == 0)
            return;
        ASSERT_TRUE(real.file.getDataset()->findAndGetElement(real.index.pixelKey(), element).good());
        QByteArray value(static_cast<int>(element->getLength()), 0);
        ASSERT_TRUE(element->getPartialValue(value.data(), 0, element->getLength()).good());
        const auto bitAt = [](const QByteArray& bytes, qint64 at) {
            return (bytes.at(int(at / 8)) >> (at % 8)) & 1;
        };
        for (int frame = 0; frame < real.index.frames(); ++frame) {
            QByteArray stored;
            ASSERT_TRUE(real.index.readStored(real.source, frame, stored).good());
            ASSERT_EQ(stored.size(), (bits + 7) / 8);
            bool isEqual = true;
            for (qint64 bit = 0; bit < bits; ++bit)
                isEqual = isEqual && bitAt(stored, bit) == bitAt(value, frame * bits + bit);
            EXPECT_TRUE(isEqual) << "frame " << frame;
            ++compared;
        }
    });
    EXPECT_GT(compared, 100);
}

TEST_F(RealFrames, AreFoundWithoutReadingThem)
{
    for (const QString& path : realFiles("transfer-syntaxes") + realFiles("multiframe")) {
        FrameIndex index;
        ByteSource source = ByteSource::ofFile(path);
        const bool isLarge = index.read(source).good() && index.frames() == 1 && source.size() > 1000 * 1000;
        EXPECT_TRUE(!isLarge || source.asked() < 200 * 1000) << qPrintable(path);
    }
}

/// A file of fragments of the given lengths; the number of a fragment is what its bytes are.
QByteArray fileOf(int frames, const QVector<int>& fragments, const QVector<quint32>& table,
                  bool startsFrames = false)
{
    const auto le32 = [](quint32 value) {
        QByteArray bytes(4, 0);
        qToLittleEndian(value, bytes.data());
        return bytes;
    };
    QByteArray bytes(128, 0);
    const QByteArray syntax("1.2.840.10008.1.2.4.80");
    bytes += QByteArray("DICM\x02\0\x10\0UI\x16\0", 12) + syntax;
    const QByteArray count = QByteArray::number(frames).rightJustified(8, ' ');
    bytes += QByteArray("\x28\0\x08\0IS\x08\0", 8) + count;
    bytes += QByteArray("\xe0\x7f\x10\0OB\0\0\xff\xff\xff\xff", 12);
    bytes += QByteArray("\xfe\xff\0\xe0", 4) + le32(quint32(table.size()) * 4);
    for (quint32 offset : table)
        bytes += le32(offset);
    for (int i = 0; i < fragments.size(); ++i) {
        QByteArray fragment(fragments.at(i), static_cast<char>(i + 1));
        if (startsFrames && i % 2 == 0)
            fragment.replace(0, 3, "\xff\xd8\xff");
        bytes += QByteArray("\xfe\xff\0\xe0", 4) + le32(quint32(fragment.size())) + fragment;
    }
    return bytes + QByteArray("\xfe\xff\xdd\xe0\0\0\0\0", 8);
}

/// The fragments of each frame by their numbers, "12|3"; "?" where that cannot be told.
std::string framesIn(const QByteArray& bytes)
{
    ByteSource source(bytes);
    FrameIndex index;
    if (index.read(source).bad())
        return "damaged";
    std::string text;
    for (int frame = 0; frame < index.frames(); ++frame) {
        QVector<FileStretch> stretches;
        text += frame > 0 ? "|" : "";
        if (index.locate(frame, stretches).bad())
            return "?";
        for (const FileStretch& stretch : stretches)
            text += std::to_string(int(bytes.at(int(stretch.end()) - 1)));
    }
    return text;
}

TEST(FragmentTables, TellFramesOnlyWhereTheyNameFragments)
{
    struct Row
    {
        int frames;
        QVector<int> fragments;
        QVector<quint32> table;
        bool startsFrames;
        const char* expected;
    };
    const Row rows[] = {
        {1, {10, 20, 30}, {}, false, "123"},
        {3, {10, 20, 30}, {}, false, "1|2|3"},
        {3, {10, 20, 30}, {0, 7, 9}, false, "1|2|3"},  // wrong, and not needed
        {2, {10, 20, 30}, {0, 18}, false, "1|23"},
        {2, {10, 20, 30}, {0, 46}, false, "12|3"},
        {2, {10, 20, 30}, {0, 19}, false, "?"},          // within a fragment
        {2, {10, 20, 30}, {18, 46}, false, "?"},         // not from the first on
        {2, {10, 20, 30}, {0, 0}, false, "?"},           // the same twice
        {2, {10, 20, 30}, {0, 0xfffffff0}, false, "?"},  // beyond the file
        {2, {10, 20, 30}, {0}, false, "?"},
        {2, {10, 20, 30}, {}, true, "12|3"},  // by what codestreams begin with
        {2, {10, 20, 30, 40}, {0, 19}, true, "12|34"},
        {3, {10, 20, 30, 40}, {}, true, "?"},  // fewer beginnings than frames
        {4, {10, 20}, {0, 18}, false, "?"},
        {20000000, {10, 20}, {}, false, "?"},
    };
    for (const Row& row : rows)
        EXPECT_EQ(framesIn(fileOf(row.frames, row.fragments, row.table, row.startsFrames)), row.expected);
}

TEST(FragmentTables, OfCutOrChangedFilesNeverLeadOutOfThem)
{
    const QByteArray whole = fileOf(2, {10, 20, 30}, {0, 18});
    for (int size = 0; size < whole.size(); ++size) {
        const std::string found = framesIn(whole.left(size));
        EXPECT_TRUE(found == "damaged" || found.empty()) << size << ' ' << found;
    }
    for (int at = 128; at < whole.size(); ++at) {
        for (int bit = 0; bit < 8; ++bit) {
            QByteArray changed = whole;
            changed[at] = static_cast<char>(quint8(changed.at(at)) ^ (1U << unsigned(bit)));
            ByteSource source(changed);
            FrameIndex index;
            QVector<FileStretch> stretches;
            if (index.read(source).bad() || index.locate(0, stretches).bad())
                continue;
            for (const FileStretch& stretch : stretches)
                EXPECT_TRUE(stretch.offset > 0 && stretch.length >= 0 && stretch.end() <= changed.size());
        }
    }
}

TEST(FrameIndex, FindsValuesInSequences)
{
    DatasetBuilder inner = anItem().with(DCM_CodeMeaning, "first");
    DatasetBuilder image = anImage().withItem(DCM_ContentSequence, inner);
    image.withItem(DCM_ContentSequence,
                   anItem().withItem(DCM_ConceptNameCodeSequence, anItem().with(DCM_CodeMeaning, "deep")));
    for (E_EncodingType lengths : {EET_ExplicitLength, EET_UndefinedLength}) {
        for (E_TransferSyntax syntax : {EXS_LittleEndianExplicit, EXS_LittleEndianImplicit}) {
            const QTemporaryDir folder;
            const QString path = folder.filePath(QStringLiteral("a.dcm"));
            image.save(path, syntax, lengths);
            ByteSource source = ByteSource::ofFile(path);
            FrameIndex index;
            FileStretch value;
            ASSERT_TRUE(index.read(source).good());
            ASSERT_TRUE(index.findValue(
                source, {{DCM_ContentSequence, 1}, {DCM_ConceptNameCodeSequence, 0}, {DCM_CodeMeaning, 0}},
                value));
            EXPECT_EQ(source.bytes().mid(int(value.offset), int(value.length)), "deep");
            EXPECT_FALSE(index.findValue(source, {{DCM_ContentSequence, 2}, {DCM_CodeMeaning, 0}}, value));
            EXPECT_FALSE(index.findValue(source, {{DCM_CodeMeaning, 0}}, value));
        }
    }
}

}  // namespace
