#include "tools/kdd/Commands.h"
#include "tools/kdd/Database.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Store.h"

#include <QDate>
#include <QJsonArray>

#include <kddlib/LogFile.h>
#include <kddlib/TagFile.h>

#include <cstdio>
#include <memory>

namespace Kdd
{

namespace
{

/// Which studies are listed; an empty text lets all pass.
struct ListRequest
{
    QByteArray patient;   ///< part of the name or identifier, whatever the case
    QByteArray date;      ///< YYYYMMDD, or a range FROM-TO with either end left out
    QByteArray modality;  ///< one that the study has
    bool waiting = false;
};

struct ListedStudy
{
    QString uid;
    QString patient;
    QString date;
    QString modalities;
    int series = 0;
    int images = 0;
    int volumes = 0;
    qint64 bytes = 0;  ///< of the tag file; 0 when there is none
    bool isWaiting = false;
};

ListedStudy describe(const Kxg::StudySummary& study)
{
    const QString tagFile = TagFile::cacheFilePathForStudy(study.studyInstanceUID.constData());
    // Values come from files, and a terminal must not obey what is in them.
    return {displayText(study.studyInstanceUID),
            displayText(study.patientName),
            displayText(study.studyDate),
            displayText(study.modalities),
            study.series,
            study.images,
            study.volumes,
            sizeOf(tagFile),
            study.isWaiting};
}

void printJsonList(const QList<ListedStudy>& studies)
{
    QJsonArray list;
    for (const ListedStudy& study : studies) {
        list.append(QJsonObject{{QStringLiteral("study"), study.uid},
                                {QStringLiteral("patient"), study.patient},
                                {QStringLiteral("date"), study.date},
                                {QStringLiteral("modalities"), study.modalities},
                                {QStringLiteral("series"), study.series},
                                {QStringLiteral("images"), study.images},
                                {QStringLiteral("volumes"), study.volumes},
                                {QStringLiteral("bytes"), study.bytes},
                                {QStringLiteral("waiting"), study.isWaiting}});
    }
    printJson({{QStringLiteral("studies"), list}});
}

void printList(const QList<ListedStudy>& studies)
{
    QList<QStringList> rows{{QStringLiteral("STUDY"), QStringLiteral("PATIENT"), QStringLiteral("DATE"),
                             QStringLiteral("MODALITIES"), QStringLiteral("SERIES "),
                             QStringLiteral("IMAGES "), QStringLiteral("VOLUMES "),
                             QStringLiteral("TAG FILE ")}};
    for (const ListedStudy& study : studies)
        rows.append({study.uid, study.patient, study.date, study.modalities, QString::number(study.series),
                     QString::number(study.images), QString::number(study.volumes),
                     // The size of a tag file that is about to be written anew says little.
                     study.isWaiting ? QStringLiteral("waiting") : humanBytes(study.bytes)});
    printTable(rows);
}

/// Days from and to, either of which may be left open.
class DateRange
{
public:
    bool parse(const QByteArray& text)
    {
        // A day alone is the range from itself to itself.
        const int dash = text.indexOf('-');
        mFrom = dash < 0 ? text : text.left(dash);
        mTo = dash < 0 ? text : text.mid(dash + 1);
        return isDay(mFrom) && isDay(mTo);
    }

    bool holds(const QByteArray& date) const
    {
        // Dates of one form are in the order of their texts; a study without date is in no range.
        return (mFrom.isEmpty() && mTo.isEmpty()) ||
               (!date.isEmpty() && date >= mFrom && (mTo.isEmpty() || date <= mTo));
    }

private:
    static bool isDay(const QByteArray& text)
    {
        return text.isEmpty() ||
               (text.size() == 8 &&
                QDate::fromString(QString::fromLatin1(text), QStringLiteral("yyyyMMdd")).isValid());
    }

    QByteArray mFrom;
    QByteArray mTo;
};

bool passes(const Kxg::StudySummary& study, const ListRequest& request)
{
    // With a line feed between them, so that nothing is found across the two.
    const QString patient = QString::fromUtf8(study.patientName + '\n' + study.patientID);
    // An empty text is part of every other one.
    return patient.contains(QString::fromLocal8Bit(request.patient), Qt::CaseInsensitive) &&
           // Modalities are written in capital letters.
           (request.modality.isEmpty() || study.modalities.split(' ').contains(request.modality.toUpper())) &&
           (!request.waiting || study.isWaiting);
}

Outcome runList(const GlobalOptions& options, const ListRequest& request)
{
    DateRange dates;
    // Refused before the database is asked.
    if (!dates.parse(request.date)) {
        LogFile::errorf("\"%s\" is no date YYYYMMDD and no range of dates", request.date.constData());
        return Outcome::WrongUsage;
    }
    const std::unique_ptr<Kxg::Catalogue> database = openExistingDatabase();
    std::vector<Kxg::StudySummary> registered;
    if (database == nullptr || !succeeded(database->listStudies(registered)))
        return Outcome::Failed;
    QList<ListedStudy> studies;
    for (const Kxg::StudySummary& study : registered) {
        if (dates.holds(study.studyDate) && passes(study, request))
            studies.append(describe(study));
    }
    if (options.json)
        printJsonList(studies);
    else
        printList(studies);
    return Outcome::Done;
}

}  // namespace

void declareList(CommandSet& commands)
{
    const CommandText text = {"list", kLooking, "List the studies",
                              "Patient, date, modalities, counts and the size of the tag file, as the "
                              "database knows them, corrections included.",
                              "kdd list\n"
                              "kdd list --modality MR --date 20240101-\n"
                              "kdd --json list --waiting              # what `kdd build` would build"};
    const auto request = std::make_shared<ListRequest>();
    ArgumentList arguments = commands.declare(
        text, [request](const GlobalOptions& options) { return runList(options, *request); });
    arguments.text({"--patient", kText, "Only those whose patient's name or identifier has this in it"},
                   request->patient);
    arguments.text({"--date", "DATE", "Only those of this date, YYYYMMDD, or of a range FROM-TO"},
                   request->date);
    arguments.text({"--modality", kText, "Only those with a series of this modality"}, request->modality);
    arguments.flag("--waiting", request->waiting, "Only those that wait to be built");
}

}  // namespace Kdd
