#include "server/dimse/RetrieveList.h"

#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>

#include <dcmtk/dcmdata/dctk.h>
#include <dcmtk/dcmdata/dcxfer.h>
#include <kddlib/OwnAttributes.h>
#include <kddlib/TagElement.h>
#include <kddlib/TagMap.h>

#include <algorithm>

namespace Kdd::Dimse
{
namespace
{

using namespace DicomWeb;

// Each is far beyond what is asked for at a time, and takes some 100 MiB.
constexpr int kMaxPaths = 20000;           // studies, series or images that are looked up
constexpr std::size_t kMaxItems = 500000;  // objects in them

const QueryEnding kTooManyMatches = {0xA701, QStringLiteral("Too many objects are asked for at once")};

bool readUids(DcmItem& dataset, const DcmTagKey& key, QVector<QByteArray>& uids, QString& reason)
{
    for (const QString& each : identifierValue(dataset, key).split(QLatin1Char('\\'))) {
        const QByteArray uid = each.trimmed().toLatin1();
        if (uid.isEmpty())
            continue;
        if (!isUID(uid)) {
            reason = QStringLiteral("A UID is none");
            return false;
        }
        if (!uids.contains(uid))
            uids.append(uid);
    }
    return true;
}

/// The first value of an attribute of an object that was found.
QByteArray uidIn(const QJsonObject& object, const char* key)
{
    return object.value(QLatin1String(key))
        .toObject()
        .value(QLatin1String("Value"))
        .toArray()
        .first()
        .toString()
        .toLatin1();
}

void require(SearchRequest& search, const DcmTagKey& key, const QVector<QByteArray>& uids)
{
    SearchCondition condition;
    condition.path = {key};
    condition.vr = EVR_UI;
    for (const QByteArray& uid : uids)
        condition.list.append(QString::fromLatin1(uid));
    if (!uids.isEmpty())
        search.conditions.push_back(condition);
}

SearchLevel searchLevelOf(QueryLevel level)
{
    switch (level) {
    case QueryLevel::Series:
        return SearchLevel::Series;
    case QueryLevel::Image:
        return SearchLevel::Instances;
    default:
        return SearchLevel::Studies;
    }
}

/// Where the identifier does not name all levels above its own, searches know them.
QueryEnding searchPaths(const RetrieveIdentifier& identifier, const StudyLimits& limits,
                        const RetrieveSource& source, std::vector<ResourcePath>& paths)
{
    SearchRequest search;
    std::vector<QByteArray> found;
    search.level = searchLevelOf(identifier.level);
    search.limit = kMaxPaths;
    require(search, DCM_StudyInstanceUID, identifier.studies);
    require(search, DCM_SeriesInstanceUID, identifier.series);
    require(search, DCM_SOPInstanceUID, identifier.images);
    if (!identifier.patientID.isEmpty()) {
        SearchCondition condition;
        condition.path = {DCM_PatientID};
        condition.vr = EVR_LO;
        condition.list = {identifier.patientID};
        search.conditions.push_back(condition);
    }
    const QueryEnding ending = findObjects(search, limits, source.database, source.studies, found);
    for (const QByteArray& json : found) {
        const QJsonObject object = QJsonDocument::fromJson(json).object();
        ResourcePath path;
        path.study = uidIn(object, "0020000D");
        if (search.level != SearchLevel::Studies)
            path.series = uidIn(object, "0020000E");
        if (search.level == SearchLevel::Instances)
            path.instance = uidIn(object, "00080018");
        paths.push_back(path);
    }
    return ending.status == kTooMany ? kTooManyMatches : ending;
}

/// All levels are named, each above the last by one UID.
bool namesAll(const RetrieveIdentifier& identifier)
{
    if (!identifier.patientID.isEmpty())
        return false;
    switch (identifier.level) {
    case QueryLevel::Patient:
        return false;
    case QueryLevel::Study:
        return identifier.series.isEmpty() && identifier.images.isEmpty();
    case QueryLevel::Series:
        return identifier.studies.size() == 1 && identifier.images.isEmpty();
    case QueryLevel::Image:
        break;
    }
    return identifier.studies.size() == 1 && identifier.series.size() == 1;
}

/// Without the database.
std::vector<ResourcePath> namedPaths(const RetrieveIdentifier& identifier)
{
    const bool isStudy = identifier.level == QueryLevel::Study;
    const bool isSeries = identifier.level == QueryLevel::Series;
    std::vector<ResourcePath> paths;
    for (const QByteArray& uid : isStudy    ? identifier.studies
                                 : isSeries ? identifier.series
                                            : identifier.images) {
        ResourcePath path;
        path.study = isStudy ? uid : identifier.studies.first();
        if (!isStudy)
            path.series = isSeries ? uid : identifier.series.first();
        if (!isStudy && !isSeries)
            path.instance = uid;
        paths.push_back(path);
    }
    return paths;
}

QByteArray storedSyntaxOf(const TagMap& image)
{
    const TagElement* element = image.findElement(kTransferSyntax);
    if (element == nullptr || element->vr() != VrCode::OB || element->value().size() != 1)
        return {};
    const int number = static_cast<unsigned char>(element->value().at(0));
    const char* uid = number <= EXS_PrivateGE_LEI_WithBigEndianPixelData
                          ? DcmXfer(static_cast<E_TransferSyntax>(number)).getXferID()
                          : nullptr;
    return uid;
}

void describeItems(const ServedStudy& study, const QByteArray& studyUID, const QVector<ListedImage>& images,
                   std::vector<RetrieveItem>& items)
{
    study.look([&](const TagFile& file) {
        for (const ListedImage& listed : images) {
            RetrieveItem item = {studyUID, listed, {}, {}};
            const TagMap* image = file.findImage(listed.key);
            if (image != nullptr) {
                image->findAndGetString(DCM_SOPClassUID, item.sopClass);
                item.storedSyntax = storedSyntaxOf(*image);
            }
            items.push_back(std::move(item));
        }
    });
}

/// Nothing there is no failure: then nothing is sent.
QueryEnding addItems(const ResourcePath& path, const StudyLimits& limits, const RetrieveSource& source,
                     std::vector<RetrieveItem>& items)
{
    const Sight sight = limits == nullptr ? Sight::Seen : source.sight.look(limits, path.study);
    if (sight != Sight::Seen)
        return sight == Sight::Hidden
                   ? QueryEnding()
                   : QueryEnding{kNoDatabase, QStringLiteral("The image database cannot be asked now")};
    std::shared_ptr<const ServedStudy> study;
    QVector<ListedImage> images;
    const Verdict found = findStudy(source.studies, path, study);
    if (found.bad() && found.status != 404)
        return {found.status == 503 ? kBusy : kUnreadable, found.reason};
    if (found.bad() || listImages(*study, path, images).bad())
        return {};
    describeItems(*study, path.study, images, items);
    return items.size() <= kMaxItems ? QueryEnding() : kTooManyMatches;
}

}  // namespace

bool RetrieveIdentifier::read(DcmItem& dataset, QueryRoot root, RetrieveIdentifier& identifier,
                              QString& reason)
{
    identifier = {};
    if (!readLevel(dataset, root, identifier.level, reason) ||
        !readUids(dataset, DCM_StudyInstanceUID, identifier.studies, reason) ||
        !readUids(dataset, DCM_SeriesInstanceUID, identifier.series, reason) ||
        !readUids(dataset, DCM_SOPInstanceUID, identifier.images, reason))
        return false;
    identifier.patientID = identifierValue(dataset, DCM_PatientID);
    // The identifier of one patient: with wildcards or a list it could be those of all.
    for (const char sign : {'*', '?', '\\'}) {
        if (identifier.patientID.contains(QLatin1Char(sign)))
            reason = QStringLiteral("The Patient ID is none of one patient");
    }
    const bool isNamed = identifier.level == QueryLevel::Patient  ? !identifier.patientID.isEmpty()
                         : identifier.level == QueryLevel::Study  ? !identifier.studies.isEmpty()
                         : identifier.level == QueryLevel::Series ? !identifier.series.isEmpty()
                                                                  : !identifier.images.isEmpty();
    if (!isNamed)
        reason = QStringLiteral("The unique key of the level is missing");
    return reason.isEmpty();
}

QueryEnding listItems(const RetrieveIdentifier& identifier, const StudyLimits& limits,
                      const RetrieveSource& source, std::vector<RetrieveItem>& items)
{
    std::vector<ResourcePath> paths;
    QueryEnding ending;
    if (namesAll(identifier))
        paths = namedPaths(identifier);
    else
        ending = searchPaths(identifier, limits, source, paths);
    // One after the other of the same study, so that its tag file is looked up once.
    std::stable_sort(paths.begin(), paths.end(),
                     [](const ResourcePath& a, const ResourcePath& b) { return a.study < b.study; });
    for (const ResourcePath& path : paths) {
        if (ending.good())
            ending = addItems(path, limits, source, items);
    }
    return ending;
}

}  // namespace Kdd::Dimse
