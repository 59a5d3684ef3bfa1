#include "server/dicomweb/change/CorrectionHistory.h"

#include "server/dicomweb/change/ObjectName.h"

#include <QDateTime>
#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QLocale>
#include <QRegularExpression>

#include <kddlib/TagMap.h>

namespace Kdd::DicomWeb
{
namespace
{

constexpr int kBlock = 64 * 1024;  // [bytes]

const char* const kHead =
    "\"study\",\"series\",\"image\",\"time\",\"who\",\"tag\",\"keyword\",\"old\",\"new\"\r\n";

QByteArray jsonOf(const QJsonArray& array)
{
    return QJsonDocument(array).toJson(QJsonDocument::Compact);
}

}  // namespace

CorrectionTime CorrectionTime::of(const QString& logged)
{
    static const QRegularExpression kForm(
        QStringLiteral("\\A(\\d{1,2}/\\d{1,2}/\\d{4} \\d{1,2}:\\d{2}:\\d{2} [AP]M)(?: (.*))?\\z"),
        QRegularExpression::DotMatchesEverythingOption);
    const QRegularExpressionMatch parts = kForm.match(logged);
    const QDateTime moment =
        QLocale::c().toDateTime(parts.captured(1), QStringLiteral("d/M/yyyy h:mm:ss AP"));
    if (!parts.hasMatch() || !moment.isValid())
        return {logged, QString()};
    return {moment.toString(QStringLiteral("yyyy-MM-ddTHH:mm:ss")), parts.captured(2)};
}

QByteArray csvField(const QString& value)
{
    // Blanks in front are passed over by some, and what is as wide as an ideograph counts as well.
    static const QString kDangerous = QStringLiteral("=+-@'\t\r\n\uff1d\uff0b\uff0d\uff20");
    const QString trimmed = value.trimmed();
    const bool isDangerous = (!value.isEmpty() && kDangerous.contains(value[0])) ||
                             (!trimmed.isEmpty() && kDangerous.contains(trimmed[0]));
    QByteArray text = value.toUtf8();
    text.replace('"', "\"\"");
    return (isDangerous ? "\"'" : "\"") + text + '"';
}

Result CorrectionHistory::next(QByteArray& block)
{
    block.resize(0);
    if (mHasEnded)
        return {};
    if (!mHasBegun && mForm == Form::Json)
        block += "{\"study\":\"" + mStudyUID + "\",\"corrections\":[";
    else if (!mHasBegun)
        block += kHead;
    mHasBegun = true;
    while (mHasImages && block.size() < kBlock)
        mStudy->look([&](const TagFile& file) { addImages(file, block); });
    if (mHasImages)
        return {};
    mHasEnded = true;
    if (mForm == Form::Json) {
        QJsonArray unreadable;
        for (const QByteArray& image : qAsConst(mUnreadable))
            unreadable.append(QString::fromLatin1(image));
        block += "],\"unreadable\":" + jsonOf(unreadable) + '}';
    }
    return {};
}

/// Until the block is full: in between others may have the tree.
void CorrectionHistory::addImages(const TagFile& file, QByteArray& block)
{
    const auto& images = file.imagesByUID();
    auto image = mLast.isNull() ? images.begin() : images.upperBound(mLast);
    for (; image != images.end() && block.size() < kBlock; ++image) {
        addImage(image.key(), *image.value(), block);
        mLast = image.key();
    }
    mHasImages = image != images.end();
}

void CorrectionHistory::addImage(const QByteArray& key, const TagMap& image, QByteArray& block)
{
    const QByteArray name = publicKey(key);
    const QByteArray series = publicKey(image.uid(TagMap::SeriesLevel));
    AuditLog log;
    QVector<AuditEntry> entries;
    if (!log.read(image) || !log.decode(entries)) {
        mUnreadable.append(name);
        if (mForm == Form::Csv)
            block += csvField(QString::fromLatin1(mStudyUID)) + ',' + csvField(QString::fromLatin1(series)) +
                     ',' + csvField(QString::fromLatin1(name)) +
                     ",\"\",\"\",\"\",\"the audit log cannot be read\",\"\",\"\"\r\n";
        return;
    }
    for (const AuditEntry& entry : qAsConst(entries)) {
        if (mForm == Form::Json)
            addJson(name, series, entry, block);
        else
            addCsv(name, series, entry, block);
    }
}

void CorrectionHistory::addJson(const QByteArray& image, const QByteArray& series, const AuditEntry& entry,
                                QByteArray& block)
{
    const CorrectionTime time = CorrectionTime::of(entry.time);
    QJsonArray changes;
    for (const AuditChange& change : entry.changes)
        changes.append(QJsonObject{{QStringLiteral("tag"), keyDigits(change.key)},
                                   {QStringLiteral("keyword"), keywordOf(change.key)},
                                   {QStringLiteral("old"), change.oldText},
                                   {QStringLiteral("new"), change.newText}});
    const QJsonObject correction = {{QStringLiteral("image"), QString::fromLatin1(image)},
                                    {QStringLiteral("series"), QString::fromLatin1(series)},
                                    {QStringLiteral("time"), time.moment},
                                    {QStringLiteral("who"), time.who},
                                    {QStringLiteral("changes"), changes}};
    block += (mIsFirst ? "" : ",") + QJsonDocument(correction).toJson(QJsonDocument::Compact);
    mIsFirst = false;
}

void CorrectionHistory::addCsv(const QByteArray& image, const QByteArray& series, const AuditEntry& entry,
                               QByteArray& block) const
{
    const CorrectionTime time = CorrectionTime::of(entry.time);
    const QByteArray before =
        csvField(QString::fromLatin1(mStudyUID)) + ',' + csvField(QString::fromLatin1(series)) + ',' +
        csvField(QString::fromLatin1(image)) + ',' + csvField(time.moment) + ',' + csvField(time.who) + ',';
    for (const AuditChange& change : entry.changes)
        block += before + csvField(keyDigits(change.key)) + ',' + csvField(keywordOf(change.key)) + ',' +
                 csvField(change.oldText) + ',' + csvField(change.newText) + "\r\n";
}

}  // namespace Kdd::DicomWeb
