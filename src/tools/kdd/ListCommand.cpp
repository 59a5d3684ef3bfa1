#include "kddlib/tagmodel/TagMap.h"
#include "tools/kdd/AttributeText.h"
#include "tools/kdd/Commands.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Store.h"

#include <QFileInfo>
#include <QJsonArray>

#include <dcmtk/dcmdata/dcdeftag.h>

#include <cstdio>

namespace Kdd
{

namespace
{

struct ListedStudy
{
    QString uid;
    QString patient;
    QString date;
    QString modalities;
    int series = 0;
    int images = 0;
    qint64 bytes = 0;
};

ListedStudy describe(const TagFile& file, const QString& path)
{
    const TagMap& study = *file.study();
    QStringList modalities;
    for (const TagMap* series : study.children())
        modalities.append(displayValue(*series, DCM_Modality));
    modalities.removeDuplicates();
    modalities.sort();
    return {displayText(file.studyInstanceUID()),
            displayValue(study, DCM_PatientName),
            displayValue(study, DCM_StudyDate),
            modalities.join(QLatin1Char(' ')),
            file.seriesByUID().size(),
            file.imagesByUID().size(),
            QFileInfo(path).size()};
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
                                {QStringLiteral("bytes"), study.bytes}});
    }
    printJson({{QStringLiteral("studies"), list}});
}

void printList(const QList<ListedStudy>& studies)
{
    QList<QStringList> rows{{QStringLiteral("STUDY"), QStringLiteral("PATIENT"), QStringLiteral("DATE"),
                             QStringLiteral("MODALITIES"), QStringLiteral("SERIES "),
                             QStringLiteral("IMAGES "), QStringLiteral("TAG FILE ")}};
    for (const ListedStudy& study : studies)
        rows.append({study.uid, study.patient, study.date, study.modalities, QString::number(study.series),
                     QString::number(study.images), humanBytes(study.bytes)});
    printTable(rows);
}

}  // namespace

Outcome runList(const GlobalOptions& options)
{
    QList<ListedStudy> studies;
    bool allRead = true;
    for (const QString& path : storedTagFiles()) {
        TagFile file;
        if (readStudyFile(path, file))
            studies.append(describe(file, path));
        else
            allRead = false;
    }
    if (options.json)
        printJsonList(studies);
    else
        printList(studies);
    return allRead ? Outcome::Done : Outcome::Failed;
}

}  // namespace Kdd
