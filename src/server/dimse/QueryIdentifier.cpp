#include "server/dimse/QueryIdentifier.h"

#include "server/dicomweb/search/AnswerObject.h"

#include <QLocale>
#include <QStringList>

#include <dcmtk/dcmdata/dctk.h>
#include <kddlib/StudyIndexing.h>
#include <kddlib/TextDecoding.h>

#include <algorithm>
#include <iterator>

namespace Kdd::Dimse
{
namespace
{

using DicomWeb::SearchCondition;
using DicomWeb::SearchLevel;

// What a question may ask for at most; as of searches over HTTP.
constexpr int kMaxKeys = 1000;  // shown, in the items of sequences too
constexpr int kMaxDepth = 8;    // attributes on the way to one, itself included

// Below are commands, meta headers and our own.
constexpr Uint16 kFirstGroup = 0x0008;

struct NamedLevel
{
    const char* name;
    QueryLevel level;
    SearchLevel search;
};

const NamedLevel kLevels[] = {
    {"PATIENT", QueryLevel::Patient, SearchLevel::Patients},
    {"STUDY", QueryLevel::Study, SearchLevel::Studies},
    {"SERIES", QueryLevel::Series, SearchLevel::Series},
    {"IMAGE", QueryLevel::Image, SearchLevel::Instances},
};

/// What answers show besides what is kept of their objects, and from which level on.
struct CountedKey
{
    DcmTagKey key;
    QueryLevel level;
};

const CountedKey kCounted[] = {
    {DCM_RetrieveAETitle, QueryLevel::Patient},
    {DCM_InstanceAvailability, QueryLevel::Patient},
    {DCM_ModalitiesInStudy, QueryLevel::Study},
    {DCM_NumberOfStudyRelatedSeries, QueryLevel::Study},
    {DCM_NumberOfStudyRelatedInstances, QueryLevel::Study},
    {DCM_StudyInstanceUID, QueryLevel::Study},
    {DCM_NumberOfSeriesRelatedInstances, QueryLevel::Series},
    {DCM_SeriesInstanceUID, QueryLevel::Series},
};

/// With all their digits, which DCMTK's texts of them do not have.
QString realsOf(DcmElement& element)
{
    QStringList numbers;
    Float64 wide = 0;
    Float32 narrow = 0;
    const bool isWide = element.ident() == EVR_FD;
    for (unsigned long i = 0; i < element.getVM(); ++i) {
        if (isWide ? element.getFloat64(wide, i).good() : element.getFloat32(narrow, i).good())
            numbers << QString::number(isWide ? wide : static_cast<double>(narrow), 'g',
                                       QLocale::FloatingPointShortest);
    }
    return numbers.join(QLatin1Char('\\'));
}

/// By their digits alone, as searches know them.
QString tagsOf(DcmElement& element)
{
    QStringList tags;
    DcmTagKey tag;
    for (unsigned long i = 0; i < element.getVM(); ++i) {
        if (element.getTagVal(tag, i).good())
            tags << QString::fromLatin1(DicomWeb::keyName(tag));
    }
    return tags.join(QLatin1Char('\\'));
}

QString decodedValue(DcmElement& element, const QByteArray& characterSet)
{
    if (element.ident() == EVR_FD || element.ident() == EVR_FL)
        return realsOf(element);
    if (element.ident() == EVR_AT)
        return tagsOf(element);
    OFString value;
    if (element.getOFStringArray(value).bad())
        return {};
    return decodeText(QByteArray(value.c_str(), static_cast<int>(value.size())), characterSet).trimmed();
}

/// What stands between backslashes is a value of its own, but not in texts of several lines.
bool hasLists(DcmEVR vr)
{
    return vr != EVR_LT && vr != EVR_ST && vr != EVR_UT && vr != EVR_UR;
}

/// Walks over the attributes of an identifier.
class Reader
{
public:
    Reader(DcmItem& dataset, QueryIdentifier& identifier, QString& reason)
        : mIdentifier(identifier)
        , mReason(reason)
    {
        OFString characterSet;
        dataset.findAndGetOFStringArray(DCM_SpecificCharacterSet, characterSet);
        mCharacterSet = characterSet.c_str();
    }

    bool read(DcmItem& item, const QVector<DcmTagKey>& path, std::vector<QueryKey>& keys)
    {
        for (DcmObject* next = item.nextInContainer(nullptr); next != nullptr;
             next = item.nextInContainer(next)) {
            if (!take(static_cast<DcmElement&>(*next), path, keys))
                return false;
        }
        return true;
    }

private:
    bool fail(const char* reason)
    {
        mReason = QLatin1String(reason);
        return false;
    }

    static bool isPassedOver(const DcmTagKey& key, bool isOutside)
    {
        return key.getGroup() < kFirstGroup || key.getElement() == 0 || key == DCM_SpecificCharacterSet ||
               (isOutside && key == DCM_QueryRetrieveLevel);
    }

    bool take(DcmElement& element, const QVector<DcmTagKey>& path, std::vector<QueryKey>& keys)
    {
        const DcmTagKey key = element.getTag().getXTag();
        if (isPassedOver(key, path.isEmpty()))
            return true;
        if (++mKeys > kMaxKeys)
            return fail("Too many attributes are asked for");
        QVector<DcmTagKey> own = path;
        own.append(key);
        keys.push_back({key, {}});
        if (path.isEmpty())
            mIdentifier.search.fields.append(key);
        return element.ident() == EVR_SQ
                   ? takeItems(static_cast<DcmSequenceOfItems&>(element), own, keys.back().items)
                   : takeValue(element, own);
    }

    bool takeItems(DcmSequenceOfItems& sequence, const QVector<DcmTagKey>& path, std::vector<QueryKey>& keys)
    {
        if (sequence.card() == 0)
            return true;
        if (sequence.card() > 1)
            return fail("A sequence asks by one item");
        if (path.size() >= kMaxDepth)
            return fail("Sequences are nested too deep");
        return read(*sequence.getItem(0), path, keys);
    }

    bool takeValue(DcmElement& element, const QVector<DcmTagKey>& path)
    {
        // All that is here has the same.
        if (path.last() == DCM_RetrieveAETitle || path.last() == DCM_InstanceAvailability)
            return true;
        SearchCondition condition;
        DicomWeb::ValueForm form;
        condition.path = path;
        condition.vr = DcmTag(path.last()).getEVR();
        condition.value = decodedValue(element, mCharacterSet);
        // Stars ask for nothing, also where values are not compared by wildcards.
        if (condition.value.count(QLatin1Char('*')) == condition.value.size())
            condition.value.clear();
        form.hasLists = hasLists(condition.vr);
        return mIdentifier.search.require(condition, form, mReason);
    }

    QueryIdentifier& mIdentifier;
    QString& mReason;
    QByteArray mCharacterSet;
    int mKeys = 0;
};

}  // namespace

bool readLevel(DcmItem& dataset, QueryRoot root, QueryLevel& level, QString& reason)
{
    const QString name = identifierValue(dataset, DCM_QueryRetrieveLevel);
    const auto* const found =
        std::find_if(std::begin(kLevels), std::end(kLevels),
                     [&](const NamedLevel& each) { return name == QLatin1String(each.name); });
    if (found == std::end(kLevels)) {
        reason = name.isEmpty() ? QStringLiteral("The Query/Retrieve Level is missing")
                                : QStringLiteral("There is no such Query/Retrieve Level");
        return false;
    }
    level = found->level;
    if (level == QueryLevel::Patient && root == QueryRoot::Study)
        reason = QStringLiteral("Study Root has no level PATIENT");
    return reason.isEmpty();
}

QString identifierValue(DcmItem& dataset, const DcmTagKey& key)
{
    DcmElement* element = nullptr;
    OFString characterSet;
    dataset.findAndGetOFStringArray(DCM_SpecificCharacterSet, characterSet);
    if (dataset.findAndGetElement(key, element).bad())
        return {};
    return decodedValue(*element, characterSet.c_str());
}

bool QueryIdentifier::read(DcmItem& dataset, QueryRoot root, QueryIdentifier& identifier, QString& reason)
{
    identifier = {};
    if (!readLevel(dataset, root, identifier.level, reason))
        return false;
    for (const NamedLevel& each : kLevels) {
        if (each.level == identifier.level)
            identifier.search.level = each.search;
    }
    identifier.search.joinsMoments = false;
    return Reader(dataset, identifier, reason).read(dataset, {}, identifier.keys);
}

bool QueryIdentifier::shows(const DcmTagKey& key) const
{
    // Of an image everything is known.
    if (level == QueryLevel::Image)
        return key != DCM_RetrieveURL;
    const bool isCounted = std::any_of(std::begin(kCounted), std::end(kCounted), [&](const CountedKey& each) {
        return each.key == key && each.level <= level;
    });
    if (isCounted)
        return true;
    if (level == QueryLevel::Patient)
        return key == DCM_NumberOfPatientRelatedStudies ||
               (key.getGroup() == DCM_PatientID.getGroup() && StudyIndexing::isStudyAttribute(key));
    return StudyIndexing::isStudyAttribute(key) ||
           (level == QueryLevel::Series && StudyIndexing::isSeriesAttribute(key));
}

}  // namespace Kdd::Dimse
