// A study of any attributes, as searches, C-FIND and the study browser tell of it: answers that can be read, that say the same of
// a value wherever it stands, and by whose values the study is found.

#include "fuzz/AnswerForms.h"
#include "fuzz/Choices.h"
#include "fuzz/Property.h"
#include "fuzz/RandomFile.h"
#include "fuzz/ServedStudy.h"
#include "server/dicomweb/search/AnswerObject.h"
#include "server/dimse/FindSearch.h"
#include "server/dimse/QueryAnswer.h"

#include <dcmtk/dcmdata/dcdicent.h>
#include <dcmtk/dcmdata/dctk.h>
#include <kddlib/StudyIndexing.h>

#include <cstdio>
#include <cstring>

using namespace Kdd;
using nlohmann::json;

namespace
{

const QVector<Http::Field> kAll = {{"includefield", "all"}};
const char* const kCharacterSet = "00080005";

struct Level
{
    const char* path;   // of searches
    const char* asked;  // of C-FIND
};

const Level kLevels[] = {
    {"studies", "STUDY"}, {"studies/1.2/series", "SERIES"}, {"studies/1.2/instances", "IMAGE"}};

/// A value of an answer to look for.
struct Wanted
{
    QVector<DcmTagKey> path;
    QByteArray value;

    QByteArray name() const
    {
        QByteArray name;
        for (const DcmTagKey& key : path)
            name += (name.isEmpty() ? "" : ".") + DicomWeb::keyName(key);
        return name;
    }
};

/// Counts and addresses are made as they are asked for; of the images all but the first are strange to the image database.
const DcmTagKey kMade[] = {DCM_SOPInstanceUID,
                           DCM_RetrieveURL,
                           DCM_InstanceAvailability,
                           DCM_NumberOfStudyRelatedSeries,
                           DCM_NumberOfStudyRelatedInstances,
                           DCM_NumberOfSeriesRelatedInstances};

bool isMade(const DcmTagKey& key)
{
    return std::find(std::begin(kMade), std::end(kMade), key) != std::end(kMade);
}

/// Whether what the element shows is a question that asks for just that.
bool isAsked(const DcmTagKey& key, const json& element, QByteArray& value)
{
    const auto isOne = [&] {
        const DcmDictEntry* const entry = dcmDataDict.rdlock().findEntry(key, nullptr);
        const bool has = entry != nullptr && entry->getVMMax() == 1;
        dcmDataDict.rdunlock();
        return has;
    };
    const QByteArray vr = QByteArray::fromStdString(element.value("vr", ""));
    const bool isUsual = vr == DcmVR(DcmTag(key).getEVR()).getValidVRName();
    if (!isUsual || key == DCM_SpecificCharacterSet || key == DCM_TimezoneOffsetFromUTC || isMade(key) ||
        !element.contains("Value") || element["Value"].empty())
        return false;
    const json& first = element["Value"][0];
    const bool isOfNumbers = vr == "DS" || vr == "IS" || vr == "FD" || vr == "FL";
    // An attribute of one value that has several is found by all of them, and what is no number by none.
    if ((element["Value"].size() > 1 && isOne()) || (isOfNumbers && !first.is_number()) || vr == "SV" ||
        vr == "DT")
        return false;
    value = textOf(first);
    const bool isMoment = vr == "DA" || vr == "TM";
    const bool isList = vr == "UI" || key == DCM_Modality || key == DCM_ModalitiesInStudy;
    const auto has = [&](const char* any) {
        return std::any_of(value.begin(), value.end(), [&](char c) { return c != 0 && std::strchr(any, c); });
    };
    // Wildcards, lists, ranges, and what is beyond the index.
    return !value.trimmed().isEmpty() && !has("*?") && !(isList && has(",\\")) && !(isMoment && has("-+:")) &&
           value.size() <= 500;
}

/// Whether the image speaks for its study and series, by whose attributes it is found.
bool describes(const json& object)
{
    return !object.contains("00080018") || textOf(object["00080018"]["Value"][0]) == "1.2.3.0";
}

std::vector<Wanted> wantedOf(const json& object, const QVector<DcmTagKey>& path);

/// All values of the object that can be asked for.
std::vector<Wanted> wantedOf(const json& object)
{
    std::vector<Wanted> wanted = wantedOf(object, {});
    if (describes(object))
        return wanted;
    const auto isOthers = [](const Wanted& each) {
        return StudyIndexing::isStudyAttribute(each.path.first()) ||
               StudyIndexing::isSeriesAttribute(each.path.first());
    };
    wanted.erase(std::remove_if(wanted.begin(), wanted.end(), isOthers), wanted.end());
    return wanted;
}

std::vector<Wanted> wantedOf(const json& object, const QVector<DcmTagKey>& path)
{
    std::vector<Wanted> wanted;
    for (const auto& each : object.items()) {
        QByteArray value;
        const QVector<DcmTagKey> own = path + QVector<DcmTagKey>{keyOf(each.key().c_str())};
        const bool isSequence = each.value().value("vr", "") == "SQ" && each.value().contains("Value");
        if (isSequence && own.size() < 3 && DcmTag(own.last()).getEVR() == EVR_SQ) {
            const std::vector<Wanted> below = wantedOf(each.value()["Value"][0], own);
            wanted.insert(wanted.end(), below.begin(), below.end());
        } else if (isAsked(own.last(), each.value(), value)) {
            wanted.push_back({own, value});
        }
    }
    return wanted;
}

class Run
{
public:
    Run(ServedStudy& study, int choice)
        : mStudy(study)
        , mChoice(static_cast<std::size_t>(choice))
        , mMetadata(ask("studies/1.2/metadata"))
    {
    }

    /// One thing in each run, so that there are more of them.
    void check(int what)
    {
        if (what == 0) {
            checkBrowser();
            return;
        }
        const Level& level = kLevels[what - 1];
        const json found = ask(level.path, kAll);
        require(!found.empty(), "the study is found");
        checkXml(level, found);
        checkShown(level, found);
        const json& object = found[mChoice % found.size()];
        checkFound(level, object);
        checkQuery(level, object);
    }

private:
    json ask(const QByteArray& path, const QVector<Http::Field>& query = {})
    {
        Http::Response response = mStudy.get(path, query);
        const QByteArray body = ServedStudy::bodyOf(response);
        require(response.status == 200, "there is an answer");
        return readJson(body);
    }

    void checkXml(const Level& level, const json& found)
    {
        Http::Response response =
            mStudy.get(level.path, kAll, "multipart/related; type=\"application/dicom+xml\"");
        const QByteArray body = ServedStudy::bodyOf(response);
        const QVector<QByteArray> parts = partsOf(ServedStudy::headerOf(response, "Content-Type"), body);
        if (static_cast<std::size_t>(parts.size()) != found.size())
            std::fprintf(stderr, "%d: %s\n", response.status, body.constData());
        require(static_cast<std::size_t>(parts.size()) == found.size(), "there are as many documents");
        for (int i = 0; i < parts.size(); ++i)
            requireSameXml(parts.at(i), found[static_cast<std::size_t>(i)]);
    }

    /// The image that describes a study or series, which is the first by its path, or the one that is meant.
    const json& metadataOf(const Level& level, const json& object) const
    {
        const json* found = nullptr;
        for (const json& image : mMetadata) {
            const bool isMeant = level.asked == kLevels[0].asked ||
                                 (level.asked == kLevels[1].asked ? image["0020000E"] == object["0020000E"]
                                                                  : image["00080018"] == object["00080018"]);
            if (isMeant && (found == nullptr || image["00080018"]["Value"] < (*found)["00080018"]["Value"]))
                found = &image;
        }
        require(found != nullptr, "what is found is there");
        return *found;
    }

    static bool isOf(const Level& level, const DcmTagKey& key)
    {
        if (level.asked == kLevels[0].asked)
            return StudyIndexing::isStudyAttribute(key);
        return level.asked == kLevels[2].asked || StudyIndexing::isSeriesAttribute(key);
    }

    void checkShown(const Level& level, const json& found) const
    {
        for (const json& object : found) {
            const json& image = metadataOf(level, object);
            for (const auto& each : image.items()) {
                const bool hasValue = each.value().contains("Value");
                if (each.key() == kCharacterSet || each.key() == "00081190" || !hasValue ||
                    !isOf(level, keyOf(each.key().c_str())))
                    continue;
                require(object.contains(each.key()), "an answer has what its image shows");
                require(isSame(object[each.key()], each.value()), "an answer shows what its image shows");
            }
        }
    }

    void checkFound(const Level& level, const json& object)
    {
        const std::vector<Wanted> all = wantedOf(object);
        if (all.empty())
            return;
        const Wanted& wanted = all[mChoice % all.size()];
        QVector<Http::Field> query = {{wanted.name(), wanted.value}};
        // Not all that is asked for helps an index.
        if (wanted.path.last() != DCM_StudyInstanceUID)
            query.append(Http::Field{"StudyInstanceUID", "1.2"});
        Http::Response response = mStudy.get(level.path, query);
        const QByteArray body = ServedStudy::bodyOf(response);
        // What is no date is no question.
        if (response.status == 400 && isMoment(wanted))
            return;
        const bool isFound = response.status == 200 && !readJson(body).empty();
        if (!isFound)
            tell(level.path, wanted, body);
        require(isFound, "a value finds what shows it");
    }

    static bool isMoment(const Wanted& wanted)
    {
        const DcmEVR vr = DcmTag(wanted.path.last()).getEVR();
        return vr == EVR_DA || vr == EVR_TM;
    }

    static void tell(const char* where, const Wanted& wanted, const QByteArray& answer)
    {
        std::fprintf(stderr, "%s: %s=\"%s\" (%s): %s\n", where, wanted.name().constData(),
                     wanted.value.constData(), wanted.value.toHex().constData(), answer.constData());
    }

    /// Two questions: for all that the object shows, and by one value of it.
    void checkQuery(const Level& level, const json& object)
    {
        DcmDataset identifier;
        for (const auto& each : object.items()) {
            const DcmTagKey key = keyOf(each.key().c_str());
            DcmElement* element = nullptr;
            const QByteArray vr = QByteArray::fromStdString(each.value().value("vr", "UN"));
            if (DcmItem::newDicomElementWithVR(element, DcmTag(key, DcmVR(vr.constData()))).good())
                identifier.insert(element, OFTrue);
        }
        identifier.putAndInsertString(DCM_QueryRetrieveLevel, level.asked);
        identifier.putAndInsertString(DCM_StudyInstanceUID, "1.2");
        Dimse::QueryIdentifier question;
        for (const QByteArray& found : find(identifier, question)) {
            DcmDataset answer;
            Dimse::fillAnswer(question, found, "TITLE", answer);
            requireSameDataset(answer, readJson(found), question);
        }
        checkQueried(level, object);
    }

    void checkQueried(const Level& level, const json& object)
    {
        const std::vector<Wanted> all = wantedOf(object);
        if (all.empty())
            return;
        const Wanted& wanted = all[mChoice % all.size()];
        DcmDataset identifier;
        DcmItem* item = &identifier;
        for (const DcmTagKey& key : wanted.path) {
            // Of a text DCMTK makes another number now and then.
            if (key == wanted.path.last() && DcmTag(key).getEVR() == EVR_FD)
                item->putAndInsertFloat64(key, wanted.value.toDouble());
            else if (key == wanted.path.last())
                item->putAndInsertString(key, wanted.value.constData());
            else
                identifier.findOrCreateSequenceItem(key, item, -2);
        }
        identifier.putAndInsertString(DCM_SpecificCharacterSet, "ISO_IR 192");
        identifier.putAndInsertString(DCM_QueryRetrieveLevel, level.asked);
        if (wanted.path.last() != DCM_StudyInstanceUID)
            identifier.putAndInsertString(DCM_StudyInstanceUID, "1.2");
        Dimse::QueryIdentifier question;
        const bool isFound = !find(identifier, question).empty();
        if (!isFound && !isMoment(wanted))
            tell(level.asked, wanted, "nothing");
        require(isFound || isMoment(wanted), "a value finds what shows it by C-FIND");
    }

    std::vector<QByteArray> find(DcmDataset& identifier, Dimse::QueryIdentifier& question)
    {
        QString reason;
        std::vector<QByteArray> found;
        require(Dimse::QueryIdentifier::read(identifier, Dimse::QueryRoot::Study, question, reason),
                "a question is understood");
        question.search.limit = 100;
        const Dimse::QueryEnding ending =
            Dimse::findObjects(question.search, nullptr, mStudy.database(), mStudy.shelf(), found);
        require(ending.good() || ending.status == Dimse::kMisunderstood, "a question is answered");
        return found;
    }

    void checkBrowser()
    {
        ask("browser/studies/1.2");
        ask("browser/studies/1.2/corrections");
        ask("browser/studies/1.2/difference", {{"a", "1.2.3.0"}, {"b", "1.2.3.1"}});
        ask("changefeed", {{"limit", "1"}});
        for (const json& image : mMetadata) {
            const QByteArray uid = textOf(image["00080018"]["Value"][0]);
            requireSameTree(ask("browser/studies/1.2/images/" + uid + "/attributes")["attributes"], image);
        }
    }

    ServedStudy& mStudy;
    std::size_t mChoice;
    json mMetadata;
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, std::size_t size)
{
    static ServedStudy study(ServedStudy::Database::Sqlite);
    const QByteArray bytes = bytesOf(data, size);
    Choices choices(bytes);
    const int choice = choices.next();
    const int form = choices.next();
    RandomFile file;
    std::vector<QByteArray> files;
    for (const char* const sop : {"1.2.3.0", "1.2.3.1"}) {
        file.change(choices);
        files.push_back(file.bytes(form % 2 != 0 && !files.empty() ? "1.2.4" : "1.2.3", sop));
    }
    if (study.replace(files))
        Run(study, choice).check(form / 4 % 4);
    return 0;
}
