#include "core/items/DatasetJson.h"
#include "kddlib/Limits.h"
#include "kddlib/items/DicomJson.h"
#include "kddlib/net/dicom/DicomFileReader.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"
#include "support/DatasetBuilder.h"
#include "support/LogCapture.h"
#include "support/RealFiles.h"

#include <gtest/gtest.h>

#include <cstring>
#include <limits>
#include <memory>
#include <random>
#include <sstream>

using namespace Kdd;

namespace
{

std::string expected(const TagMap& map, bool own = false)
{
    return comparable(datasetJson(map, "a\"b", own ? JsonEntries::Own : JsonEntries::Merged));
}

std::string written(const TagMap& map, bool own = false)
{
    std::ostringstream out;
    (own ? writeOwnDicomJson : writeDicomJson)(out, map, "a\"b");
    return comparable(out.str());
}

const DcmTagKey kCreator(0x0009, 0x0010), kPrivate(0x0009, 0x1001), kRetired(0x0008, 0x0001);
const DcmTagKey kKeys[] = {
    DCM_StudyDescription,
    DCM_PatientName,
    DCM_PatientComments,
    DCM_Rows,
    DCM_ImageType,
    DCM_PixelSpacing,
    DCM_InstanceNumber,
    DCM_FrameIncrementPointer,
    DCM_SmallestImagePixelValue,
    DCM_RetrieveURL,
    DCM_DoubleFloatPixelData,
    DCM_SelectorSVValue,
    DCM_SelectorUVValue,
    DCM_SelectorOVValue,
    DCM_LongCodeValue,
    DCM_PixelData,
    DCM_ReferencedSOPInstanceUID,
    DCM_LUTData,
    DCM_OverlayData,
    kFilePath,
    kRetired,
    kCreator,
    kPrivate,
};

/// Trees of all that a tag file may hold, each made of the same few attributes so that images share much.
class RandomTree
{
public:
    explicit RandomTree(unsigned int seed)
        : mRandom(seed)
    {
    }

    std::unique_ptr<TagFile> study()
    {
        auto file = std::make_unique<TagFile>();
        mDeclares = oneIn(2);
        for (int i = 0; i < 6; ++i) {
            auto* image = new TagMap;
            fill(*image, 0);
            image->putAndInsertString(kFilePath, "/never/shown");
            image->putAndInsertString(DCM_StudyInstanceUID, "1.2");
            image->putAndInsertString(DCM_SeriesInstanceUID, oneIn(2) ? "1.3" : "1.4");
            image->putAndInsertString(DCM_SOPInstanceUID, QByteArray::number(i + 1));
            file->addTagMap(image, nullptr, true);
        }
        if (oneIn(2))
            file->optimizeAll();
        return file;
    }

private:
    int below(int count) { return static_cast<int>(mRandom() % static_cast<unsigned int>(count)); }
    bool oneIn(int count) { return below(count) == 0; }

    template <typename List>
    auto oneOf(const List& all)
    {
        return all[below(static_cast<int>(std::size(all)))];
    }

    QByteArray text()
    {
        static const QList<QByteArray> kPlain =
            QByteArray(
                R"(|A|A\B|A\|A\B\\C|1\\2|\|a  |  a|~|say "x"|19990101|Doe^John|Doe^J=X^Y=Z|^|A^|=|A==B)"
                R"(|   |A=B=C|^A^^=^B |12|-1.5|007|+3|1e3|1E-3|.5| 5 |-0|--1|-|0.0|00.5|1.2.840|1.2 .3)")
                .split('|');
        static const char* const kEncoded[] = {
            "M\xfcller",   "M\xc3\xbcller", "M\xfc\\N\xf6^x",   "\xbb\xee\xda", "\x1b$B;3ED\x1b(B",
            "a\nb\tc\x01", "\xff\xfe",      "\xd4\xcf\xc0\xde", "\x80",         "\x7f"};
        if (!oneIn(4))
            return oneOf(kPlain);
        return !mDeclares && oneIn(2) ? "plain" : oneOf(kEncoded);
    }

    QByteArray characterSet()
    {
        static const char* const kLatin[] = {"", "ISO_IR 6", "ISO_IR 100"};
        static const char* const kAny[] = {"",           "ISO_IR 6",         "ISO_IR 100",
                                           "ISO_IR 192", "ISO_IR 144",       "ISO_IR 13",
                                           "GB18030",    "\\ISO 2022 IR 87", "ISO 2022 IR 13\\ISO 2022 IR 87",
                                           "nonsense"};
        return mDeclares ? oneOf(kAny) : oneOf(kLatin);
    }

    QByteArray bytes()
    {
        static const double kDoubles[] = {0, -0.0, 1.5, 1e300, 1e-7, 1.0 / 3, 123456789};
        static const float kFloats[] = {0.F, 1.5F, 3e30F, 1e-9F, 1.F / 3, -16777216.F};
        QByteArray all;
        for (int count = below(3); count > 0; --count) {
            const double wide = oneOf(kDoubles);
            const float narrow = oneOf(kFloats);
            // Finite also as one real or two, for DCMTK writes no JSON of what is not.
            const quint64 number = ((quint64(mRandom()) << 32) | mRandom()) & 0xBFFFFFFF'BFFFFFFF;
            char buffer[8];
            std::memcpy(buffer, &wide, 8);
            if (oneIn(3))
                std::memcpy(buffer, &narrow, 4);
            if (oneIn(3))
                std::memcpy(buffer, &number, 8);
            all.append(buffer, 8);
        }
        return all.left(all.size() - (oneIn(8) ? below(8) : 0));
    }

    DcmTagKey key() { return oneOf(kKeys); }

    VrCode vr()
    {
        using V = VrCode;
        static const V kCodes[] = {V::AE, V::AS, V::AT, V::CS, V::DA,      V::DS,       V::DT, V::FL, V::FD,
                                   V::IS, V::LO, V::LT, V::OB, V::OF,      V::OW,       V::PN, V::SH, V::SL,
                                   V::SQ, V::SS, V::ST, V::TM, V::UI,      V::UL,       V::US, V::UT, V::Ox,
                                   V::Xs, V::Lt, V::Up, V::UN, V::Unknown, V::PixelData};
        return oneOf(kCodes);
    }

    void fill(TagMap& map, int depth)
    {
        for (int count = below(12); count > 0; --count) {
            const VrCode code = vr();
            QByteArray value = isTextVr(code) ? text() : bytes();
            // DCMTK takes that for the name of a UID.
            if (code == VrCode::UI && value.startsWith('='))
                value.clear();
            map.putElement(oneOf(kKeys), new TagElement(code, value));
        }
        for (int count = below(3); count > 0; --count)
            map.putElement(oneOf(kKeys), new TagElement(VrCode::LO, text()));
        // What stands there is of our own making, and not in the image's character set.
        if (map.findElement(kFilePath) != nullptr)
            map.putAndInsertString(kFilePath, "/never/shown");
        if (oneIn(4))
            map.markAsOmitted(oneOf(kKeys));
        if (depth == 0 ? !oneIn(4) : oneIn(mDeclares ? 4 : 40))
            map.putElement(DCM_SpecificCharacterSet, new TagElement(VrCode::CS, characterSet()));
        if (depth < 3 && oneIn(2)) {
            auto* sequence = new TagSequence;
            for (int items = below(3); items > 0; --items) {
                auto* item = oneIn(20) ? nullptr : new TagMap;
                if (item != nullptr)
                    fill(*item, depth + 1);
                sequence->addItem(item);
            }
            map.putElement(oneIn(2) ? DCM_ReferencedImageSequence : DcmTagKey(0x0009, 0x1002), sequence);
        }
    }

    std::mt19937 mRandom;
    bool mDeclares = false;
};

TEST(ImageWriter, EqualsTheWayByDatasetsForRandomTrees)
{
    const LogCapture log;
    int different = 0;
    for (unsigned int seed = 1; seed <= 400 && different < 5; ++seed) {
        const std::unique_ptr<TagFile> file = RandomTree(seed).study();
        DicomImageWriter writer(MetadataForm::Json);
        for (const TagMap* image : file->imagesByUID()) {
            QByteArray text("before");
            writer.append(text, *image, "a\"b");
            EXPECT_EQ(comparable(text.toStdString()), "before" + expected(*image))
                << seed << (++different, "");
            EXPECT_EQ(written(*image, true), expected(*image, true)) << seed << (++different, "");
        }
        for (const TagMap* series : file->seriesByUID())
            EXPECT_EQ(written(*series), expected(*series)) << seed << (++different, "");
    }
}

TEST(ImageWriter, WritesOnlyWhatIsWantedAndWhatNamesTheImage)
{
    DatasetBuilder image =
        anImage("1.9").with(DCM_Rows, "512").with(DCM_PatientName, "Doe").with(DCM_PatientID, "7");
    image.withItem(DCM_ReferencedImageSequence, anItem().with(DCM_PatientID, "8"));
    const std::unique_ptr<TagMap> map(image.map());
    QByteArray text;
    DicomImageWriter(MetadataForm::Json, {DCM_Rows, DCM_ReferencedImageSequence}).append(text, *map, "root");
    EXPECT_EQ(text.toStdString(),
              R"({"00080005":{"vr":"CS","Value":["ISO_IR 192"]},"00080018":{"vr":"UI","Value":["1.9"]},)"
              R"("00081140":{"vr":"SQ","Value":[{"00100020":{"vr":"LO","Value":["8"]}}]},)"
              R"("0020000D":{"vr":"UI","Value":["1.2"]},"0020000E":{"vr":"UI","Value":["1.2.3"]},)"
              R"("00280010":{"vr":"US","Value":[512]}})");
}

TEST(ImageWriter, WritesTheNativeModel)
{
    DatasetBuilder image = anItem().with(DCM_SpecificCharacterSet, "ISO_IR 100");
    image.with(DCM_PatientName, "M\xfcller^J<&>=\xfc")
        .with(DCM_PixelSpacing, "0.5\\0.5")
        .with(DCM_Rows, "512");
    image.withItem(DCM_ReferencedImageSequence, anItem().with(DCM_FrameIncrementPointer, "(0018,1063)"));
    image.with(TagElement(VrCode::LO, "ACME").newDcmElement(DcmTag(0x0009, 0x0010, EVR_LO)).release());
    image.with(TagElement(VrCode::OB, "ab").newDcmElement(DcmTag(0x0009, 0x1001, EVR_OB)).release());
    const std::unique_ptr<TagMap> map(image.map());
    map->markAsOmitted(DCM_PixelData);
    QByteArray text;
    DicomImageWriter(MetadataForm::Xml).append(text, *map, "a&b");
    EXPECT_EQ(
        text.toStdString(),
        R"(<?xml version="1.0" encoding="UTF-8"?>)"
        "\n"
        R"(<NativeDicomModel xml:space="preserve">)"
        R"(<DicomAttribute tag="00080005" vr="CS" keyword="SpecificCharacterSet"><Value number="1">ISO_IR 192</Value></DicomAttribute>)"
        R"(<DicomAttribute tag="00081140" vr="SQ" keyword="ReferencedImageSequence"><Item number="1">)"
        R"(<DicomAttribute tag="00280009" vr="AT" keyword="FrameIncrementPointer"><Value number="1">00181063</Value></DicomAttribute>)"
        R"(</Item></DicomAttribute>)"
        R"(<DicomAttribute tag="00090010" vr="LO"><Value number="1">ACME</Value></DicomAttribute>)"
        R"(<DicomAttribute tag="00090001" vr="OB" privateCreator="ACME"><InlineBinary>YWI=</InlineBinary></DicomAttribute>)"
        R"(<DicomAttribute tag="00100010" vr="PN" keyword="PatientName"><PersonName number="1"><Alphabetic>)"
        R"(<FamilyName>Müller</FamilyName><GivenName>J&lt;&amp;&gt;</GivenName></Alphabetic>)"
        R"(<Ideographic><FamilyName>ü</FamilyName></Ideographic></PersonName></DicomAttribute>)"
        R"(<DicomAttribute tag="00280010" vr="US" keyword="Rows"><Value number="1">512</Value></DicomAttribute>)"
        R"(<DicomAttribute tag="00280030" vr="DS" keyword="PixelSpacing"><Value number="1">0.5</Value>)"
        R"(<Value number="2">0.5</Value></DicomAttribute>)"
        R"(<DicomAttribute tag="7FE00010" vr="OB" keyword="PixelData"><BulkData uri="a&amp;b/7FE00010"/></DicomAttribute>)"
        "</NativeDicomModel>\n");
}

}  // namespace
