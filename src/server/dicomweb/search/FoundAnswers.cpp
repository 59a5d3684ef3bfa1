#include "server/dicomweb/search/FoundAnswers.h"

#include <dcmtk/dcmdata/dcdeftag.h>
#include <kddlib/DicomJson.h>
#include <kddlib/TagElement.h>
#include <kddlib/TagMap.h>

#include <algorithm>
#include <iterator>
#include <sstream>

namespace Kdd::DicomWeb
{
namespace
{

using Attributes = std::vector<AttributeNumber>;

// What an answer has of its level in any case, without a value where there is none.

const AnswerObject::Element kOfStudy[] = {{0x00080020, R"({"vr":"DA"})"}, {0x00080030, R"({"vr":"TM"})"},
                                          {0x00080050, R"({"vr":"SH"})"}, {0x00080090, R"({"vr":"PN"})"},
                                          {0x00081030, R"({"vr":"LO"})"}, {0x00100010, R"({"vr":"PN"})"},
                                          {0x00100020, R"({"vr":"LO"})"}, {0x00100030, R"({"vr":"DA"})"},
                                          {0x00100040, R"({"vr":"CS"})"}, {0x00200010, R"({"vr":"SH"})"}};

const AnswerObject::Element kOfSeries[] = {{0x00080021, R"({"vr":"DA"})"},
                                           {0x00080031, R"({"vr":"TM"})"},
                                           {0x00080060, R"({"vr":"CS"})"},
                                           {0x0008103E, R"({"vr":"LO"})"},
                                           {0x00200011, R"({"vr":"IS"})"}};

const AnswerObject::Element kOfPatient[] = {{0x00100010, R"({"vr":"PN"})"},
                                            {0x00100020, R"({"vr":"LO"})"},
                                            {0x00100030, R"({"vr":"DA"})"},
                                            {0x00100040, R"({"vr":"CS"})"}};

constexpr AttributeNumber kPatientGroup = 0x0010;

// Shown where there is a value.
const Attributes kAlsoOfSeries = {0x00080005, 0x00080201, 0x00400244, 0x00400245, 0x00400275};
const Attributes kAlsoOfStudy = {0x00080005, 0x00080201};
const Attributes kAlsoOfPatient = {0x00080005};

const DcmTagKey kImageKeys[] = {
    DCM_SpecificCharacterSet,
    DCM_SOPClassUID,
    DCM_SOPInstanceUID,
    DCM_TimezoneOffsetFromUTC,
    DCM_StudyInstanceUID,
    DCM_SeriesInstanceUID,
    DCM_InstanceNumber,
    DCM_NumberOfFrames,
    DCM_Rows,
    DCM_Columns,
    DCM_BitsAllocated,
};

template <size_t n>
Attributes wanted(const AnswerObject::Element (&always)[n], const Attributes& also, const Attributes& fields)
{
    Attributes all = also;
    for (const AnswerObject::Element& each : always)
        all.push_back(each.attribute);
    all.insert(all.end(), fields.begin(), fields.end());
    std::sort(all.begin(), all.end());
    return all;
}

/// Those that are not there yet, without value.
template <size_t n>
void addMissing(AnswerObject& object, const AnswerObject::Element (&always)[n])
{
    for (const AnswerObject::Element& each : always)
        object.add(each);
}

void addModalities(AnswerObject& object, const QByteArray& modalities)
{
    // Without a value there is nothing: viewers fall over an empty one.
    if (modalities.isEmpty())
        return;
    QByteArray list;
    for (const QByteArray& each : modalities.split('\\'))
        list += (list.isEmpty() ? "" : ",") + jsonText(each);
    object.add(0x00080061, "{\"vr\":\"CS\",\"Value\":[" + list + "]}");
}

QByteArray ownJson(const TagMap& image, const std::vector<DcmTagKey>& keys, bool isWhole,
                   const QByteArray& address)
{
    std::ostringstream json;
    const std::string values = (address + "/bulkdata").toStdString();
    if (isWhole) {
        writeDicomJson(json, image, values);
        return QByteArray::fromStdString(json.str());
    }
    TagMap chosen;
    for (const DcmTagKey& key : keys) {
        const TagElement* element = image.findElement(key);
        if (element != nullptr && !element->markedAsOmitted())
            chosen.putElement(key, element->clone());
    }
    writeDicomJson(json, chosen, values);
    return QByteArray::fromStdString(json.str());
}

}  // namespace

FoundAnswers::FoundAnswers(const SearchRequest& request, const QByteArray& root)
    : mRequest(request)
    , mRoot(root)
    , mImageKeys(std::begin(kImageKeys), std::end(kImageKeys))
{
    const auto show = [this](const DcmTagKey& key) {
        mFields.push_back(numberOf(key));
        if (std::find(mImageKeys.begin(), mImageKeys.end(), key) == mImageKeys.end())
            mImageKeys.push_back(key);
    };
    for (const DcmTagKey& key : request.fields)
        show(key);
    // What was asked for by its value is shown.
    for (const SearchCondition& condition : request.conditions)
        show(condition.path.front());
    std::sort(mFields.begin(), mFields.end());
    mOfStudy = wanted(kOfStudy, kAlsoOfStudy, mFields);
    mOfSeries = wanted(kOfSeries, kAlsoOfSeries, mFields);
    // Of the other fields only those of the patient are the same in all studies.
    Attributes ofPatient;
    std::copy_if(mFields.begin(), mFields.end(), std::back_inserter(ofPatient),
                 [](AttributeNumber each) { return each >> 16 == kPatientGroup; });
    mOfPatient = wanted(kOfPatient, kAlsoOfPatient, ofPatient);
}

void FoundAnswers::begin(AnswerObject& object, const QByteArray& address) const
{
    object.add({0x00080056, R"({"vr":"CS","Value":["ONLINE"]})"});
    if (!address.isEmpty())
        object.addText(0x00081190, "UR", address);
}

void FoundAnswers::finish(AnswerObject& object)
{
    if (!mEnds.empty())
        mJson += ',';
    object.write(mJson);
    mEnds.push_back(mJson.size());
}

QByteArray FoundAnswers::object(int index) const
{
    const auto at = static_cast<std::size_t>(index);
    const int begin = index == 0 ? 0 : mEnds[at - 1] + 1;
    return mJson.mid(begin, mEnds[at] - begin);
}

QByteArray FoundAnswers::addressOf(const Kxg::FoundStudy& study) const
{
    return mRoot + "/studies/" + study.uid;
}

void FoundAnswers::add(const Kxg::FoundPatient& patient)
{
    AnswerObject object;
    object.addLines(patient.attributes, mOfPatient);
    addMissing(object, kOfPatient);
    object.addNumber(0x00201200, patient.studies);
    finish(object);
}

void FoundAnswers::addStudy(AnswerObject& object, const Kxg::FoundStudy& study) const
{
    addModalities(object, study.modalities);
    object.addNumber(0x00201206, study.series);
    object.addNumber(0x00201208, study.instances);
    object.addText(0x0020000D, "UI", study.uid);
    if (mRequest.showsAll)
        object.addAllLines(study.attributes);
    else
        object.addLines(study.attributes, mOfStudy);
    addMissing(object, kOfStudy);
}

void FoundAnswers::addSeries(AnswerObject& object, const Kxg::FoundSeries& series) const
{
    object.addNumber(0x00201209, series.instances);
    object.addText(0x0020000D, "UI", series.study.uid);
    object.addText(0x0020000E, "UI", series.uid);
    if (mRequest.showsAll)
        object.addAllLines(series.attributes);
    else
        object.addLines(series.attributes, mOfSeries);
    // Below a study the study's own attributes are shown where they are named.
    object.addLines(series.study.attributes, mFields);
    addMissing(object, kOfSeries);
}

void FoundAnswers::add(const Kxg::FoundStudy& study)
{
    AnswerObject object;
    begin(object, addressOf(study));
    addStudy(object, study);
    finish(object);
}

void FoundAnswers::add(const Kxg::FoundSeries& series)
{
    AnswerObject object;
    begin(object, addressOf(series.study) + "/series/" + series.uid);
    addSeries(object, series);
    if (mRequest.study.isEmpty())
        addStudy(object, series.study);
    finish(object);
}

void FoundAnswers::add(const Kxg::FoundSeries& series, const TagMap& image)
{
    AnswerObject object;
    const QByteArray address =
        addressOf(series.study) + "/series/" + series.uid + "/instances/" + image.uid(TagMap::ImageLevel);
    begin(object, address);
    object.addObject(ownJson(image, mImageKeys, mRequest.showsAll, address));
    if (mRequest.series.isEmpty())
        addSeries(object, series);
    if (mRequest.study.isEmpty())
        addStudy(object, series.study);
    finish(object);
}

}  // namespace Kdd::DicomWeb
