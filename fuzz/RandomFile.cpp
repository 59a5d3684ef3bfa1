#include "fuzz/RandomFile.h"

#include "fuzz/Choices.h"

#include <QtEndian>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dctag.h>
#include <dcmtk/dcmdata/dcuid.h>

#include <algorithm>
#include <iterator>

namespace Kdd
{
namespace
{

constexpr int kMaxDepth = 3;

// What answers about studies, series and images show, what they are found by, and what has forms of its own.
const DcmTagKey kKeys[] = {DCM_SpecificCharacterSet,
                           DCM_ImageType,
                           DCM_StudyDate,
                           DCM_StudyTime,
                           DCM_AccessionNumber,
                           DCM_Modality,
                           DCM_InstitutionName,
                           DCM_ReferringPhysicianName,
                           DCM_TimezoneOffsetFromUTC,
                           DCM_StudyDescription,
                           DCM_SeriesDescription,
                           DCM_OperatorsName,
                           DCM_AdmittingDiagnosesDescription,
                           DCM_RetrieveURL,
                           DCM_PatientName,
                           DCM_PatientID,
                           DCM_PatientBirthDate,
                           DCM_PatientSex,
                           DCM_OtherPatientNames,
                           DCM_PatientSize,
                           DCM_PatientWeight,
                           DCM_PatientComments,
                           DCM_AdditionalPatientHistory,
                           DCM_PixelSpacing,
                           DCM_FrameOfReferenceUID,
                           DCM_StudyID,
                           DCM_SeriesNumber,
                           DCM_InstanceNumber,
                           DCM_FrameIncrementPointer,
                           DCM_PerformedProcedureStepStartDate,
                           DCM_PerformedProcedureStepStartTime,
                           DCM_AcquisitionDateTime,
                           DCM_RequestAttributesSequence,
                           DCM_ProcedureCodeSequence,
                           DCM_OtherPatientIDsSequence,
                           DCM_ScheduledProcedureStepID,
                           DCM_CodeMeaning,
                           DCM_LongCodeValue,
                           DCM_SelectorFDValue,
                           DCM_SelectorFLValue,
                           DCM_SelectorSLValue,
                           DCM_SelectorSVValue,
                           DCM_SelectorUSValue,
                           DCM_RecommendedDisplayFrameRateInFloat,
                           DCM_TextValue,
                           DCM_EncapsulatedDocument,
                           DCM_LUTData,
                           DCM_OverlayData,
                           DCM_PixelData,
                           {0x0009, 0x0010},
                           {0x0009, 0x1001},
                           {0x0009, 0x1002},
                           {0x0009, 0x1101}};

const char* const kVrs[] = {"AE", "AS", "AT", "CS", "DA", "DS", "DT", "FD", "FL", "IS", "LO", "LT",
                            "OB", "OD", "OF", "OL", "OV", "OW", "PN", "SH", "SL", "SQ", "SS", "ST",
                            "SV", "TM", "UC", "UI", "UL", "UN", "UR", "US", "UT", "UV"};

// What a fuzzer would take long to come upon.
const QByteArray kPieces[] = {"ISO_IR 100",
                              "ISO_IR 192",
                              "ISO_IR 13",
                              "GB18030",
                              "\\ISO 2022 IR 87",
                              "ISO 2022 IR 13\\ISO 2022 IR 159",
                              "\\ISO 2022 IR 149",
                              "ISO_IR 999",
                              "M\xfcller",
                              "M\xc3\xbcller",
                              "Yamada^Tarou=\x1b$B;3ED\x1b(B^\x1b$BB@O:\x1b(B=\x1b$B$d$^$@\x1b(B",
                              "\xd4\xde\xc0\xde^\xc0\xdb\xb3=\x1b$B;3ED\x1b(J^\x1b$BB@O:\x1b(J",
                              "\xcd\xf5^\xd0\xa1\xb6\xab",
                              "\xf0\x9f\x98\x80",
                              "\xef\xbf\xbf",
                              "\xc3",
                              "~",
                              "\\",
                              "^",
                              "=",
                              " ",
                              "\"<&>'",
                              "\t\r\n\x0c\x1f\x7f",
                              QByteArray("\0", 1),
                              "*",
                              "?",
                              ",",
                              "-",
                              "20240131",
                              "2024.01.31",
                              "101530.25",
                              "20240131101530+0100",
                              "1e-320",
                              "1e400",
                              "1e-400",
                              "-0.0",
                              "+.5",
                              "007",
                              "12345678901234567890",
                              QByteArray::fromHex("0000000000000100"),
                              QByteArray::fromHex("000000000000f07f"),
                              QByteArray::fromHex("9a9999999999b93f"),
                              QByteArray::fromHex("0000c07f"),
                              "http://host/a?b=c&d=%20",
                              "1.2.840.10008.1.2",
                              "ACME 1.0"};

QByteArray valueOf(Choices& choices)
{
    QByteArray value;
    for (int left = choices.next() % 5; left > 0; --left) {
        const auto choice = static_cast<std::size_t>(choices.next());
        value += choice < std::size(kPieces) ? kPieces[choice] : choices.value();
    }
    // Longer ones are left out of what is kept, and the longest would be shown in parts.
    constexpr int kLong = 1500;
    const bool isRepeated = choices.next() > 240;
    while (isRepeated && !value.isEmpty() && value.size() < kLong)
        value += value;
    const bool isOdd = choices.next() > 250;
    return value.size() % 2 == 0 || isOdd ? value : value + ' ';
}

QByteArray vrOf(const DcmTagKey& key, RandomFile::Vrs vrs, Choices& choices)
{
    const int choice = choices.next();
    const QByteArray known = DcmVR(DcmTag(key).getEVR()).getValidVRName();
    const bool isUsual = vrs == RandomFile::Vrs::Usual || (choice < 200 && known != "UN");
    return isUsual ? known : QByteArray(kVrs[static_cast<std::size_t>(choice) % std::size(kVrs)]);
}

bool isLong(const QByteArray& vr)
{
    static const char* const kLong[] = {"OB", "OD", "OF", "OL", "OV", "OW", "SQ",
                                        "SV", "UC", "UN", "UR", "UT", "UV"};
    return std::any_of(std::begin(kLong), std::end(kLong), [&](const char* each) { return vr == each; });
}

template <typename Number>
void appendNumber(QByteArray& out, Number number)
{
    char bytes[sizeof(Number)];
    qToLittleEndian(number, bytes);
    out.append(bytes, static_cast<int>(sizeof bytes));
}

void appendTag(QByteArray& out, Uint16 group, Uint16 element)
{
    appendNumber<quint16>(out, group);
    appendNumber<quint16>(out, element);
}

constexpr quint32 kOpen = 0xffffffff;

}  // namespace

void RandomFile::change(Attributes& attributes, Choices& choices, int depth) const
{
    for (int left = choices.next() % 8; left > 0 && !choices.isAtEnd(); --left) {
        const DcmTagKey key = kKeys[static_cast<std::size_t>(choices.next()) % std::size(kKeys)];
        const QByteArray vr = vrOf(key, mVrs, choices);
        Attribute made;
        made.vr = vr;
        if (made.vr != "SQ") {
            made.value = valueOf(choices);
        } else {
            const int form = choices.next();
            made.isOpen = form % 2 != 0;
            for (int items = depth < kMaxDepth ? form / 2 % 4 : 0; items > 0; --items) {
                made.items.append(Attributes());
                change(made.items.last(), choices, depth + 1);
            }
        }
        attributes.insert(key, made);
    }
}

QByteArray RandomFile::itemsOf(const Attribute& attribute, Syntax syntax)
{
    QByteArray out;
    for (const Attributes& item : attribute.items) {
        QByteArray content;
        write(content, item, syntax);
        appendTag(out, 0xfffe, 0xe000);
        appendNumber(out, attribute.isOpen ? kOpen : static_cast<quint32>(content.size()));
        out += content;
        if (attribute.isOpen) {
            appendTag(out, 0xfffe, 0xe00d);
            appendNumber<quint32>(out, 0);
        }
    }
    if (attribute.isOpen) {
        appendTag(out, 0xfffe, 0xe0dd);
        appendNumber<quint32>(out, 0);
    }
    return out;
}

void RandomFile::write(QByteArray& out, const DcmTagKey& key, const Attribute& attribute, Syntax syntax)
{
    const bool isSequence = attribute.vr == "SQ";
    const QByteArray value = isSequence ? itemsOf(attribute, syntax) : attribute.value;
    appendTag(out, key.getGroup(), key.getElement());
    if (syntax == Syntax::Explicit)
        out += attribute.vr;
    if (syntax == Syntax::Explicit && !isLong(attribute.vr)) {
        appendNumber(out, static_cast<quint16>(value.size()));
    } else {
        if (syntax == Syntax::Explicit)
            appendNumber<quint16>(out, 0);
        appendNumber(out, isSequence && attribute.isOpen ? kOpen : static_cast<quint32>(value.size()));
    }
    out += value;
}

void RandomFile::write(QByteArray& out, const Attributes& attributes, Syntax syntax)
{
    for (auto at = attributes.begin(); at != attributes.end(); ++at)
        write(out, at.key(), at.value(), syntax);
}

QByteArray RandomFile::bytes(const QByteArray& seriesUID, const QByteArray& sopUID, Syntax syntax) const
{
    const auto uid = [](const QByteArray& text) {
        return Attribute{"UI", text.size() % 2 == 0 ? text : text + '\0', {}, false};
    };
    Attributes attributes = mAttributes;
    attributes.insert(DCM_SOPClassUID, uid(UID_SecondaryCaptureImageStorage));
    attributes.insert(DCM_SOPInstanceUID, uid(sopUID));
    attributes.insert(DCM_StudyInstanceUID, uid("1.2"));
    attributes.insert(DCM_SeriesInstanceUID, uid(seriesUID));
    Attributes meta;
    meta.insert(DCM_MediaStorageSOPClassUID, uid(UID_SecondaryCaptureImageStorage));
    meta.insert(DCM_MediaStorageSOPInstanceUID, uid(sopUID));
    meta.insert(DCM_TransferSyntaxUID,
                uid(syntax == Syntax::Explicit ? UID_LittleEndianExplicitTransferSyntax
                                               : UID_LittleEndianImplicitTransferSyntax));
    QByteArray head;
    write(head, meta, Syntax::Explicit);
    QByteArray length;
    appendNumber(length, static_cast<quint32>(head.size()));
    QByteArray out = QByteArray(128, 0) + "DICM";
    write(out, DCM_FileMetaInformationGroupLength, {"UL", length, {}, false}, Syntax::Explicit);
    out += head;
    write(out, attributes, syntax);
    return out;
}

}  // namespace Kdd
