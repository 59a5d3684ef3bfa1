#include "server/dicomweb/change/CorrectionReport.h"

#include "server/dicomweb/change/ObjectName.h"

#include <QHash>
#include <QJsonDocument>
#include <QJsonObject>

#include <vector>

namespace Kdd::DicomWeb
{
namespace
{

/// Of all that is told of values. Nobody reads more, and the study's history has the rest.
constexpr qint64 kMostDetail = qint64(16) * 1024 * 1024;

QJsonArray attributesOf(const QVector<AuditChange>& changes)
{
    QJsonArray made;
    for (const AuditChange& change : changes)
        made.append(QJsonObject{{QStringLiteral("tag"), keyDigits(change.key)},
                                {QStringLiteral("keyword"), keywordOf(change.key)},
                                {QStringLiteral("old"), change.oldText},
                                {QStringLiteral("new"), change.newText}});
    return made;
}

struct Group
{
    QJsonArray attributes;
    QStringList images;
};

class Groups
{
public:
    void add(const QAImageOutcome& image)
    {
        const QJsonArray attributes = attributesOf(image.changes);
        const QByteArray text = QJsonDocument(attributes).toJson(QJsonDocument::Compact);
        const auto known = mKnown.constFind(text);
        if (known == mKnown.constEnd() && mDetail + text.size() > kMostDetail) {
            mIsComplete = false;
            return;
        }
        if (known == mKnown.constEnd()) {
            mDetail += text.size();
            mKnown.insert(text, mGroups.size());
            mGroups.push_back({attributes, {}});
        }
        mGroups[mKnown.value(text)].images.append(QString::fromLatin1(publicKey(image.image)));
    }

    /// In an order of its own: that of the tree is the order in which images arrived.
    QJsonArray json()
    {
        QJsonArray made;
        for (Group& group : mGroups) {
            group.images.sort();
            made.append(QJsonObject{{QStringLiteral("count"), group.images.size()},
                                    {QStringLiteral("images"), QJsonArray::fromStringList(group.images)},
                                    {QStringLiteral("attributes"), group.attributes}});
        }
        return made;
    }

    bool isComplete() const { return mIsComplete; }

private:
    QHash<QByteArray, std::size_t> mKnown;
    std::vector<Group> mGroups;
    qint64 mDetail = 0;
    bool mIsComplete = true;
};

}  // namespace

bool tellChanges(const QAData::Outcome& outcome, QJsonArray& changes)
{
    Groups groups;
    for (const QAImageOutcome& image : outcome.images)
        groups.add(image);
    changes = groups.json();
    return groups.isComplete();
}

QByteArray correctionReport(const QAData& job, const QByteArray& root, bool isPreview)
{
    QJsonArray changes;
    const bool isComplete = tellChanges(job.outcome, changes);
    QJsonArray notFound;
    for (const QByteArray& key : job.outcome.notFound)
        notFound.append(QString::fromLatin1(publicKey(key)));
    const QString study = QString::fromLatin1(job.studyUID);
    QJsonObject report = {
        {QStringLiteral("study"), study},
        {QStringLiteral("url"), QString::fromUtf8(root) + QStringLiteral("/studies/") + study},
        {QStringLiteral("preview"), isPreview},
        {QStringLiteral("pending"), job.outcome.fault == ChangeFault::Kept},
        {QStringLiteral("images"), job.outcome.asked},
        {QStringLiteral("changed"), job.outcome.changed},
        {QStringLiteral("moved"), job.outcome.moved},
        {QStringLiteral("notFound"), notFound},
        {QStringLiteral("changes"), changes},
        {QStringLiteral("complete"), isComplete}};
    if (!job.oldStudyUID.isEmpty())
        report.insert(QStringLiteral("oldStudy"), QString::fromLatin1(job.oldStudyUID));
    return QJsonDocument(report).toJson(QJsonDocument::Compact);
}

}  // namespace Kdd::DicomWeb
