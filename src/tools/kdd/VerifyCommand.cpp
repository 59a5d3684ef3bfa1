#include "kddlib/net/KxDcmFileLoader.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "tools/kdd/Commands.h"
#include "tools/kdd/DatasetVerifier.h"
#include "tools/kdd/Progress.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Store.h"

#include <dcmtk/dcmdata/dcfilefo.h>

#include <cstdio>

namespace Kdd
{

namespace
{

struct Findings
{
    int studies = 0;
    int images = 0;
    int differences = 0;
    int unreadable = 0;
};

void verifyImage(const QByteArray& key, const TagMap& image, Findings& findings)
{
    const QByteArray path = filePathOf(image);
    DcmFileFormat file;
    const OFCondition condition = loadDicomFile(path.constData(), file);
    if (condition.bad()) {
        ++findings.unreadable;
        LogFile::errorf("Could not load %s: %s", path.constData(), condition.text());
        return;
    }
    ++findings.images;
    findings.differences +=
        verifyDataset(*file.getDataset(), image, [&](const QByteArray& attribute, const QByteArray& fault) {
            LogFile::errorf("Image %s: %s %s", key.constData(), attribute.constData(), fault.constData());
        });
}

void verifyStudy(const QString& path, const GlobalOptions& options, Findings& findings)
{
    TagFile file;
    if (!readStudyFile(path, file)) {
        ++findings.unreadable;
        return;
    }
    ++findings.studies;
    Progress progress("Verifying", !options.quiet);
    qint64 done = 0;
    const auto& images = file.imagesByUID();
    for (auto it = images.cbegin(); it != images.cend(); ++it) {
        verifyImage(it.key(), *it.value(), findings);
        progress.show(++done, images.size());
    }
}

/// The tag files to look at; studies that are not found count as unreadable.
QStringList chosenFiles(const StudySelection& selection, Findings& findings)
{
    if (selection.all)
        return storedTagFiles();
    QStringList paths;
    for (const QByteArray& text : selection.studies) {
        QByteArray studyUID;
        if (resolveStudy(text, studyUID))
            paths.append(TagFile::cacheFilePathForStudy(studyUID.constData()));
        else
            ++findings.unreadable;
    }
    return paths;
}

}  // namespace

Outcome runVerify(const GlobalOptions& options, const StudySelection& selection)
{
    if (selection.all != selection.studies.isEmpty()) {
        LogFile::errorf("Name the studies to verify, or --all");
        return Outcome::WrongUsage;
    }
    Findings findings;
    for (const QString& path : chosenFiles(selection, findings))
        verifyStudy(path, options, findings);
    if (options.json) {
        printJson({{QStringLiteral("studies"), findings.studies},
                   {QStringLiteral("images"), findings.images},
                   {QStringLiteral("differences"), findings.differences},
                   {QStringLiteral("unreadable"), findings.unreadable}});
    } else if (!options.quiet) {
        std::printf("%d studies, %d images: %d differences, %d unreadable\n", findings.studies,
                    findings.images, findings.differences, findings.unreadable);
    }
    return findings.differences == 0 && findings.unreadable == 0 ? Outcome::Done : Outcome::Failed;
}

}  // namespace Kdd
