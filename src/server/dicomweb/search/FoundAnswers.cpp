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

using Names = std::vector<std::pair<QByteArray, const char*>>;

// What an answer has of its level in any case, without a value where there is none.

const Names& studyNames()
{
    static const Names kNames = {
        {"00080020", "DA"}, {"00080030", "TM"}, {"00080050", "SH"}, {"00080090", "PN"}, {"00081030", "LO"},
        {"00100010", "PN"}, {"00100020", "LO"}, {"00100030", "DA"}, {"00100040", "CS"}, {"00200010", "SH"}};
    return kNames;
}

const Names& seriesNames()
{
    static const Names kNames = {
        {"00080021", "DA"}, {"00080031", "TM"}, {"00080060", "CS"}, {"0008103E", "LO"}, {"00200011", "IS"}};
    return kNames;
}

const Names& patientNames()
{
    static const Names kNames = {
        {"00100010", "PN"}, {"00100020", "LO"}, {"00100030", "DA"}, {"00100040", "CS"}};
    return kNames;
}

// Shown where there is a value.
const char* const kAlsoOfSeries[] = {"00080005", "00080201", "00400244", "00400245", "00400275"};
const char* const kAlsoOfStudy[] = {"00080005", "00080201"};

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

std::vector<QByteArray> wanted(const Names& names, const char* const* also, size_t numAlso,
                               const std::vector<QByteArray>& fields)
{
    std::vector<QByteArray> all(also, also + numAlso);
    for (const auto& each : names)
        all.push_back(each.first);
    all.insert(all.end(), fields.begin(), fields.end());
    return all;
}

void addModalities(AnswerObject& object, const QByteArray& modalities)
{
    // Without a value there is nothing: viewers fall over an empty one.
    if (modalities.isEmpty())
        return;
    QByteArray list;
    for (const QByteArray& each : modalities.split('\\'))
        list += (list.isEmpty() ? "" : ",") + jsonText(each);
    object.add("00080061", "{\"vr\":\"CS\",\"Value\":[" + list + "]}");
}

QByteArray ownJson(const TagMap& image, const std::vector<DcmTagKey>& keys, bool isWhole,
                   const QByteArray& address)
{
    std::ostringstream json;
    if (isWhole) {
        writeDicomJson(json, image, (address + "/bulkdata").toStdString());
        return QByteArray::fromStdString(json.str());
    }
    TagMap chosen;
    for (const DcmTagKey& key : keys) {
        const TagElement* element = image.findElement(key);
        if (element != nullptr && !element->markedAsOmitted())
            chosen.putElement(key, element->clone());
    }
    writeDicomJson(json, chosen, std::string());
    return QByteArray::fromStdString(json.str());
}

}  // namespace

FoundAnswers::FoundAnswers(const SearchRequest& request, const QByteArray& root)
    : mRequest(request)
    , mRoot(root)
    , mImageKeys(std::begin(kImageKeys), std::end(kImageKeys))
{
    const auto show = [this](const DcmTagKey& key) {
        mFields.push_back(keyName(key));
        if (std::find(mImageKeys.begin(), mImageKeys.end(), key) == mImageKeys.end())
            mImageKeys.push_back(key);
    };
    for (const DcmTagKey& key : request.fields)
        show(key);
    // What was asked for by its value is shown.
    for (const SearchCondition& condition : request.conditions)
        show(condition.path.front());
}

void FoundAnswers::begin(AnswerObject& object, const QByteArray& address) const
{
    object.addText("00080056", "CS", "ONLINE");
    if (!address.isEmpty())
        object.addText("00081190", "UR", address);
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
    object.addLines(patient.attributes, wanted(patientNames(), kAlsoOfStudy, 1, {}));
    // Of the other fields only those of the patient are the same in all studies.
    for (const QByteArray& field : mFields) {
        if (field.startsWith("0010"))
            object.addLines(patient.attributes, {field});
    }
    object.addMissing(patientNames());
    object.addNumber("00201200", patient.studies);
    finish(object);
}

void FoundAnswers::addStudy(AnswerObject& object, const Kxg::FoundStudy& study) const
{
    addModalities(object, study.modalities);
    object.addNumber("00201206", study.series);
    object.addNumber("00201208", study.instances);
    object.addText("0020000D", "UI", study.uid);
    if (mRequest.showsAll)
        object.addAllLines(study.attributes);
    else
        object.addLines(study.attributes,
                        wanted(studyNames(), kAlsoOfStudy, std::size(kAlsoOfStudy), mFields));
    object.addMissing(studyNames());
}

void FoundAnswers::addSeries(AnswerObject& object, const Kxg::FoundSeries& series) const
{
    object.addNumber("00201209", series.instances);
    object.addText("0020000D", "UI", series.study.uid);
    object.addText("0020000E", "UI", series.uid);
    if (mRequest.showsAll)
        object.addAllLines(series.attributes);
    else
        object.addLines(series.attributes,
                        wanted(seriesNames(), kAlsoOfSeries, std::size(kAlsoOfSeries), mFields));
    // Below a study the study's own attributes are shown where they are named.
    object.addLines(series.study.attributes, mFields);
    object.addMissing(seriesNames());
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
