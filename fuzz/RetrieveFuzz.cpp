// An object of any attributes, as it is retrieved, corrected perhaps: a DICOM file that others can read, which differs from the
// one that came in what was corrected and in nothing else, and says what its metadata say. What metadata leave out is found where
// they say.

#include "fuzz/AnswerForms.h"
#include "fuzz/Choices.h"
#include "fuzz/Property.h"
#include "fuzz/RandomFile.h"
#include "fuzz/ServedStudy.h"

#include <QUrl>

#include <dcmtk/dcmdata/dcistrmb.h>
#include <dcmtk/dcmdata/dcostrmb.h>
#include <dcmtk/dcmdata/dctk.h>
#include <kddlib/DicomJson.h>
#include <kddlib/Limits.h>
#include <kddlib/QAData.h>

#include <cstdio>
#include <sstream>

using namespace Kdd;
using nlohmann::json;

namespace
{

const QByteArray kInstance = "studies/1.2/series/1.2.3/instances/1.2.3.0";
constexpr Uint16 kAuditGroup = 0x0071;

const char* const kSingle[] = {"application/dicom; transfer-syntax=*",
                               "application/dicom; transfer-syntax=1.2.840.10008.1.2.1",
                               "application/dicom; transfer-syntax=1.2.840.10008.1.2",
                               "application/dicom; transfer-syntax=1.2.840.10008.1.2.1.99"};

const DcmTagKey kCorrected[] = {
    DCM_PatientName,     DCM_PatientID, DCM_StudyDescription, DCM_PatientWeight,   DCM_StudyDate,
    DCM_PatientComments, DCM_ImageType, DCM_InstanceNumber,   DCM_SelectorFDValue, DCM_SelectorUSValue};

bool canParse(const QByteArray& bytes, DcmFileFormat& file)
{
    DcmInputBufferStream in;
    in.setBuffer(bytes.constData(), bytes.size());
    in.setEos();
    file.transferInit();
    const OFCondition condition = file.read(in);
    file.transferEnd();
    if (condition.bad())
        std::fprintf(stderr, "%s\n", condition.text());
    return condition.good() && file.loadAllDataIntoMemory().good();
}

void parse(const QByteArray& bytes, DcmFileFormat& file)
{
    require(canParse(bytes, file), "an object can be read");
}

/// What its values are, whatever its transfer syntax was.
QByteArray contentOf(DcmDataset& dataset)
{
    static std::vector<char> room(1 << 22);
    DcmOutputBufferStream out(room.data(), static_cast<offile_off_t>(room.size()));
    dataset.transferInit();
    require(dataset.write(out, EXS_LittleEndianImplicit, EET_ExplicitLength, nullptr, EGL_withoutGL).good(),
            "an object can be written");
    dataset.transferEnd();
    void* bytes = nullptr;
    offile_off_t length = 0;
    out.flushBuffer(bytes, length);
    return {static_cast<const char*>(bytes), static_cast<int>(length)};
}

/// Takes out what a correction changes, which includes the record of it.
void removeCorrected(DcmDataset& dataset, const DcmTagKey& key)
{
    dataset.findAndDeleteElement(key);
    for (unsigned long i = dataset.card(); i > 0; --i)
        if (dataset.getElement(i - 1)->getGTag() == kAuditGroup)
            delete dataset.remove(i - 1);
}

void tell(DcmDataset& a, DcmDataset& b)
{
    for (unsigned long i = 0; i < std::max(a.card(), b.card()); ++i) {
        std::ostringstream left;
        std::ostringstream right;
        if (i < a.card())
            a.getElement(i)->print(left, DCMTypes::PF_shortenLongTagValues);
        if (i < b.card())
            b.getElement(i)->print(right, DCMTypes::PF_shortenLongTagValues);
        if (left.str() != right.str())
            std::fprintf(stderr, "- %s+ %s", left.str().c_str(), right.str().c_str());
    }
}

class Run
{
public:
    Run(ServedStudy& study, const QByteArray& file)
        : mStudy(study)
        , mFile(file)
    {
    }

    /// False for a file that others cannot read either.
    bool begin() { return canParse(mFile, mSource); }

    void correct(const DcmTagKey& key, const QString& value)
    {
        QAData job;
        QString message;
        job.studyUID = "1.2";
        job.images = {"1.2.3.0"};
        job.substitutions = {{key, value}};
        const bool isDone = TagFile::applyQA(job, message);
        require(isDone || !message.isEmpty(), "a refusal has a reason");
        mStudy.touch();
        if (isDone && job.outcome.changed > 0)
            mCorrected = key;
    }

    void check(std::size_t form)
    {
        const char* const accept = kSingle[form % std::size(kSingle)];
        const QByteArray single = bodyOf(kInstance, accept);
        require(form % std::size(kSingle) != 0 || isCorrected() || single == mFile,
                "what was not corrected is given as it came");
        checkContent(single);
        checkMetadata(single);
        Http::Response response = mStudy.get(
            "studies/1.2", {}, QByteArray("multipart/related; type=\"application/dicom\"; ") + (accept + 19));
        require(response.status == 200, "a study can be retrieved");
        const QVector<QByteArray> parts =
            partsOf(ServedStudy::headerOf(response, "Content-Type"), ServedStudy::bodyOf(response));
        require(parts.size() == 1 && parts.first() == single, "a part is what is given alone");
        checkValues(metadata());
    }

private:
    bool isCorrected() const { return mCorrected != DCM_UndefinedTagKey; }

    QByteArray bodyOf(const QByteArray& path, const QByteArray& accept)
    {
        Http::Response response = mStudy.get(path, {}, accept);
        QByteArray body = ServedStudy::bodyOf(response);
        if (response.status != 200)
            std::fprintf(stderr, "%s: %d %s\n", path.constData(), response.status, body.constData());
        require(response.status == 200, "there is an answer");
        return body;
    }

    json metadata() { return readJson(bodyOf(kInstance + "/metadata", "application/dicom+json"))[0]; }

    void checkContent(const QByteArray& single)
    {
        DcmFileFormat read;
        parse(single, read);
        // Copies of both, in which values of odd length are padded.
        DcmFileFormat given(read);
        DcmFileFormat source(mSource);
        if (isCorrected()) {
            removeCorrected(*given.getDataset(), mCorrected);
            removeCorrected(*source.getDataset(), mCorrected);
        }
        const bool isSame = contentOf(*given.getDataset()) == contentOf(*source.getDataset());
        if (!isSame)
            tell(*source.getDataset(), *given.getDataset());
        require(isSame, "nothing but what was corrected is another");
    }

    void checkMetadata(const QByteArray& single)
    {
        DcmFileFormat given;
        parse(single, given);
        // Without VRs of their own private attributes are of none.
        if (given.getDataset()->getOriginalXfer() == EXS_LittleEndianImplicit)
            return;
        const std::unique_ptr<TagMap> map(TagMap::createTagMap(given.getDataset(), kDefaultValueBound));
        std::ostringstream text;
        writeDicomJson(text, *map, "../../instances/1.2.3.0/bulkdata");
        json said = readJson(QByteArray::fromStdString(text.str()));
        json wanted = metadata();
        // Pixels are of a VR of theirs where they were not.
        said.erase("7FE00010");
        wanted.erase("7FE00010");
        require(isSame(said, wanted), "an object says what its metadata say");
    }

    void checkValues(const json& object)
    {
        for (const auto& each : object.items()) {
            if (each.value().contains("BulkDataURI"))
                checkValue(textOf(each.value()["BulkDataURI"]));
            if (each.value().value("vr", "") == "SQ")
                for (const json& item : each.value().value("Value", json::array()))
                    checkValues(item);
        }
    }

    void checkValue(const QByteArray& address)
    {
        const QUrl asked(QStringLiteral("http://host/") + QString::fromLatin1(kInstance) +
                         QStringLiteral("/metadata"));
        const QByteArray path = asked.resolved(QUrl(QString::fromUtf8(address))).path().mid(1).toUtf8();
        require(path.startsWith(kInstance), "a value is one of the instance");
        const QByteArray given = bodyOf(path, "*/*");
        DcmElement& element = elementAt(path.mid(path.indexOf("bulkdata/") + 9).split('/'));
        // Of UIDs and codes DCMTK takes off what is none as it reads them.
        if (element.getVR() == EVR_UI || element.getVR() == EVR_CS)
            return;
        const QByteArray held = valueOf(element);
        // It reads one of odd length with something behind.
        const bool isSame = given == held.left(given.size()) && held.size() - given.size() < 2;
        if (!isSame)
            std::fprintf(stderr, "%s: %s, not %s\n", path.constData(), given.toHex().constData(),
                         held.toHex().constData());
        require(isSame, "a value is that of the file");
    }

    DcmElement& elementAt(const QList<QByteArray>& steps)
    {
        DcmItem* item = mSource.getDataset();
        for (int i = 0; i + 2 < steps.size(); i += 2)
            require(item->findAndGetSequenceItem(keyOf(steps.at(i)), item, steps.at(i + 1).toInt()).good(),
                    "an address leads to a value");
        DcmElement* element = nullptr;
        require(item->findAndGetElement(keyOf(steps.last()), element).good(), "an address leads to a value");
        return *element;
    }

    static QByteArray valueOf(DcmElement& element)
    {
        QByteArray bytes(static_cast<int>(element.getLength()), 0);
        const bool isRead =
            bytes.isEmpty() ||
            element.getPartialValue(bytes.data(), 0, element.getLength(), nullptr, EBO_LittleEndian).good();
        require(isRead, "a value can be read");
        return bytes;
    }

    ServedStudy& mStudy;
    QByteArray mFile;
    DcmFileFormat mSource;
    DcmTagKey mCorrected = DCM_UndefinedTagKey;
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, std::size_t size)
{
    static ServedStudy study(ServedStudy::Database::None);
    const QByteArray bytes = bytesOf(data, size);
    Choices choices(bytes);
    const auto form = static_cast<std::size_t>(choices.next());
    const int correction = choices.next();
    const auto key = static_cast<std::size_t>(correction) % std::size(kCorrected);
    const QString value = correction < 128 ? QString::fromUtf8(choices.value()) : QString();
    const bool isImplicit = form / 4 % 4 == 0;
    RandomFile file(isImplicit || form % 4 == 2 ? RandomFile::Vrs::Usual : RandomFile::Vrs::Any);
    file.change(choices);
    file.change(choices);
    const QByteArray made = file.bytes(
        "1.2.3", "1.2.3.0", isImplicit ? RandomFile::Syntax::Implicit : RandomFile::Syntax::Explicit);
    if (!study.replace({made}))
        return 0;
    Run run(study, made);
    if (!run.begin())
        return 0;
    if (correction < 128)
        run.correct(kCorrected[key], value);
    run.check(form);
    return 0;
}
