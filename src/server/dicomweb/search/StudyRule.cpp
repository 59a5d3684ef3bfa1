#include "server/dicomweb/search/StudyRule.h"

#include "server/dicomweb/search/AnswerObject.h"
#include "server/dicomweb/search/SearchRequest.h"

#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcdicent.h>
#include <dcmtk/dcmdata/dcdict.h>
#include <kddlib/StudyIndexing.h>

#include <algorithm>

namespace Kdd::DicomWeb
{
namespace
{

constexpr DcmEVR kTexts[] = {EVR_AE, EVR_CS, EVR_LO, EVR_PN, EVR_SH, EVR_UI};

bool hasOneValue(const DcmTagKey& key)
{
    const DcmDataDictionary& dictionary = dcmDataDict.rdlock();
    const DcmDictEntry* const entry = dictionary.findEntry(key, nullptr);
    const bool isOne = entry != nullptr && entry->getVMMax() == 1;
    dcmDataDict.rdunlock();
    return isOne;
}

QJsonValue valueOf(const QByteArray& vr, const QString& text)
{
    static const char* const kGroups[] = {"Alphabetic", "Ideographic", "Phonetic"};
    if (vr != "PN")
        return text;
    QJsonObject name;
    const QStringList groups = text.split(QLatin1Char('='));
    for (int i = 0; i < std::min(groups.size(), 3); ++i)
        if (!groups.at(i).isEmpty())
            name.insert(QLatin1String(kGroups[i]), groups.at(i));
    return name;
}

}  // namespace

bool StudyRule::resolve(const QByteArray& name, StudyRule& rule)
{
    DcmTagKey key;
    DcmEVR vr = EVR_UNKNOWN;
    if (!resolveAttribute(name, key, vr) || !hasOneValue(key) ||
        std::find(std::begin(kTexts), std::end(kTexts), vr) == std::end(kTexts))
        return false;
    rule.attribute = keyName(key);
    rule.vr = DcmVR(vr).getVRName();
    if (key == DCM_StudyInstanceUID)
        rule.of = Kxg::StudyLimit::Of::Uid;
    else if (StudyIndexing::isStudyAttribute(key))
        rule.of = Kxg::StudyLimit::Of::Study;
    else if (StudyIndexing::isSeriesAttribute(key))
        rule.of = Kxg::StudyLimit::Of::Series;
    else
        return false;
    return true;
}

Kxg::StudyLimit StudyRule::limit(const QStringList& values) const
{
    Kxg::StudyLimit made;
    made.of = of;
    made.attribute = attribute;
    for (const QString& each : values) {
        const QString text = each.trimmed();
        if (text.isEmpty())
            continue;
        const QJsonObject element = {{QStringLiteral("vr"), QString::fromLatin1(vr)},
                                     {QStringLiteral("Value"), QJsonArray{valueOf(vr, text)}}};
        made.values.append(of == Kxg::StudyLimit::Of::Uid
                               ? text.toUtf8()
                               : attribute + QJsonDocument(element).toJson(QJsonDocument::Compact));
    }
    return made;
}

}  // namespace Kdd::DicomWeb
