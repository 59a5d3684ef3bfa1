#include "fuzz/AnswerForms.h"
#include "fuzz/Property.h"
#include "server/dicomweb/search/AnswerObject.h"
#include "server/dimse/QueryIdentifier.h"

#include <QString>
#include <QStringList>
#include <QTextCodec>

#include <dcmtk/dcmdata/dcistrmb.h>
#include <dcmtk/dcmdata/dcostrmb.h>
#include <dcmtk/dcmdata/dctk.h>

#include <algorithm>
#include <cstdio>
#include <vector>

namespace Kdd
{
namespace
{

using nlohmann::json;

QString stringOf(const json& value)
{
    return QString::fromUtf8(textOf(value));
}

bool isUtf8(const QByteArray& text)
{
    QTextCodec::ConverterState state(QTextCodec::IgnoreHeader);
    QTextCodec::codecForName("UTF-8")->toUnicode(text.constData(), text.size(), &state);
    return state.invalidChars == 0 && state.remainingChars == 0;
}

/// As it comes out at the other end.
void transfer(DcmDataset& dataset, E_TransferSyntax syntax, DcmDataset& received)
{
    static std::vector<char> room(1 << 20);
    DcmOutputBufferStream out(room.data(), static_cast<offile_off_t>(room.size()));
    dataset.transferInit();
    require(dataset.write(out, syntax, EET_ExplicitLength, nullptr).good(), "an answer can be sent");
    dataset.transferEnd();
    void* bytes = nullptr;
    offile_off_t length = 0;
    out.flushBuffer(bytes, length);
    DcmInputBufferStream in;
    in.setBuffer(bytes, length);
    in.setEos();
    received.transferInit();
    const OFCondition condition = received.read(in, syntax);
    if (condition.bad())
        std::fprintf(stderr, "%s\n", condition.text());
    require(condition.good(), "an answer can be read");
    received.transferEnd();
}

QStringList textsOf(DcmElement& element)
{
    char* text = nullptr;
    Uint32 length = 0;
    element.getString(text, length);
    const QByteArray bytes(text, text == nullptr ? 0 : static_cast<int>(length));
    require(isUtf8(bytes), "an answer is in the character set that it declares");
    const DcmEVR vr = element.getVR();
    const bool isWhole = vr == EVR_LT || vr == EVR_ST || vr == EVR_UT || vr == EVR_UR;
    const QString all = QString::fromUtf8(bytes);
    QStringList texts = isWhole ? QStringList{all} : all.split(QLatin1Char('\\'));
    for (QString& each : texts)
        each = each.trimmed();
    return texts;
}

bool isNumberOf(DcmElement& element, unsigned long index, double number)
{
    Float64 wide = 0;
    Float32 narrow = 0;
    OFString text;
    if (element.getVR() == EVR_FD)
        return element.getFloat64(wide, index).good() && wide == number;
    if (element.getVR() == EVR_FL)
        return element.getFloat32(narrow, index).good() && narrow == static_cast<Float32>(number);
    return element.getOFString(text, index).good() && QByteArray(text.c_str()).toDouble() == number;
}

bool isTagOf(DcmElement& element, unsigned long index, const QString& digits)
{
    DcmTagKey tag;
    return element.getTagVal(tag, index).good() && DicomWeb::keyName(tag) == digits.toLatin1();
}

bool hasControls(const QString& text)
{
    return std::any_of(text.begin(), text.end(), [](QChar each) { return each.unicode() < ' '; });
}

void requireSameItem(DcmItem& item, const json& object);

void requireSameElement(DcmElement& element, const json& expected)
{
    const json values = expected.value("Value", json::array());
    // Of another VR than the dictionary's an answer shows what can be written by that.
    const DcmVR known(DcmTag(element.getTag().getXTag()).getEVR());
    if (expected["vr"] != known.getValidVRName() && known.getValidEVR() != EVR_UN)
        return;
    if (element.ident() == EVR_SQ) {
        auto& sequence = static_cast<DcmSequenceOfItems&>(element);
        if (sequence.card() != values.size())
            std::fprintf(stderr, "%s has %lu items, %s in JSON\n", element.getTag().toString().c_str(),
                         sequence.card(), expected.dump().c_str());
        require(sequence.card() == values.size(), "an answer has all items");
        for (unsigned long i = 0; i < sequence.card(); ++i)
            requireSameItem(*sequence.getItem(i), values[i]);
        return;
    }
    const bool isText = DcmVR(element.getVR()).isaString() && element.getVR() != EVR_AT;
    const QStringList texts = isText ? textsOf(element) : QStringList();
    for (std::size_t i = 0; i < values.size(); ++i) {
        const json& value = values[i];
        bool holds = false;
        if (value.is_number())
            holds = isNumberOf(element, i, value.get<double>());
        else if (element.getVR() == EVR_AT)
            holds = isTagOf(element, i, stringOf(value));
        else if (isText && element.getVR() == EVR_UI && hasControls(stringOf(value)))
            holds = true;  // of what is no UID DCMTK takes them off
        else if (isText)
            holds = texts.value(static_cast<int>(i)) == stringOf(value).trimmed();
        else
            holds = true;  // of what is no text a text in its place
        if (!holds)
            std::fprintf(stderr, "%s %s is \"%s\" in the answer, %s in JSON\n",
                         element.getTag().toString().c_str(), DcmVR(element.getVR()).getVRName(),
                         qPrintable(texts.join(QLatin1Char('\\'))), value.dump().c_str());
        require(holds, "an answer has the value that was found");
    }
}

void requireSameItem(DcmItem& item, const json& object)
{
    for (unsigned long i = 0; i < item.card(); ++i) {
        DcmElement& element = *item.getElement(i);
        const std::string key = DicomWeb::keyName(element.getTag()).toStdString();
        if (object.contains(key) && key != "00080005" && key != "00080054" && key != "00080052" &&
            key != "7FE00010")
            requireSameElement(element, object[key]);
    }
}

}  // namespace

void requireSameDataset(DcmDataset& answer, const json& object, const Dimse::QueryIdentifier& question)
{
    for (const E_TransferSyntax syntax : {EXS_LittleEndianExplicit, EXS_LittleEndianImplicit}) {
        DcmDataset received;
        transfer(answer, syntax, received);
        for (const Dimse::QueryKey& key : question.keys)
            require(!question.shows(key.key) || received.tagExists(key.key),
                    "an answer has what was asked for");
        if (syntax == EXS_LittleEndianExplicit)
            requireSameItem(received, object);
    }
}

}  // namespace Kdd
