#include "tools/kdd/CommandProgress.h"
#include "tools/kdd/Database.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Selection.h"
#include "tools/kdd/Store.h"

#include <kddlib/LogFile.h>
#include <kddlib/StudyCheck.h>
#include <kddlib/StudyProof.h>

#include <cstdio>
#include <memory>

namespace Kdd
{

namespace
{

struct VerifyRequest
{
    StudySelection selection;
    bool deep = false;     ///< all bytes of DICOM and volume files, too
    bool records = false;  ///< with deep: those without a digest get one
    bool heals = false;    ///< tag files that are not those written last are built anew
};

/// By digests. False, with the reason logged, when the database cannot be asked.
bool prove(const VerifyRequest& request, StudyProof& proof, const QVector<QByteArray>& studyUIDs)
{
    Result result;
    for (const QByteArray& studyUID : studyUIDs) {
        if (CommandProgress::wasInterrupted())
            break;
        // Of the others the check itself tells, which comes after this and finds what was healed.
        if (request.heals)
            result = proof.checkTagFile(studyUID);
        QByteArray position;
        bool isDone = false;
        if (result.good() && request.deep)
            result = proof.checkFiles(studyUID, position, isDone);
        if (!succeeded(result))
            return false;
    }
    return true;
}

bool everyStudy(Kxg::Catalogue& database, QVector<QByteArray>& studyUIDs)
{
    std::vector<Kxg::StudySummary> studies;
    if (!succeeded(database.listStudies(studies)))
        return false;
    for (const Kxg::StudySummary& study : studies)
        studyUIDs.append(study.studyInstanceUID);
    return true;
}

void tell(const GlobalOptions& options, const VerifyRequest& request, const CheckFindings& check,
          const StudyProof::Findings& proof)
{
    QJsonObject told = {{QStringLiteral("studies"), check.studies},
                        {QStringLiteral("images"), check.images},
                        {QStringLiteral("differences"), check.differences},
                        {QStringLiteral("unreadable"), check.unreadable}};
    QByteArray more;
    if (request.heals) {
        told.insert(QStringLiteral("healed"), proof.healed);
        more += ", " + QByteArray::number(proof.healed) + " tag files built anew";
    }
    if (request.deep) {
        const int faulty = proof.faults - proof.tagFileFaults;
        told.insert(QStringLiteral("files"), proof.files);
        told.insert(QStringLiteral("faulty"), faulty);
        told.insert(QStringLiteral("undigested"), proof.undigested);
        told.insert(QStringLiteral("recorded"), proof.recorded);
        more += "; " + QByteArray::number(proof.files) +
                " files by their bytes: " + QByteArray::number(faulty) + " faulty, " +
                QByteArray::number(proof.undigested) + " without digest, " +
                QByteArray::number(proof.recorded) + " recorded";
    }
    if (options.json)
        printJson(told);
    else if (!options.quiet)
        std::printf("%d studies, %d images: %d differences, %d unreadable%s\n", check.studies, check.images,
                    check.differences, check.unreadable, more.constData());
}

Outcome runVerify(const GlobalOptions& options, const VerifyRequest& request)
{
    const StudySelection& selection = request.selection;
    // All studies may take hours, so they are asked for by name.
    if (selection.all != selection.studies.isEmpty()) {
        LogFile::errorf("Name the studies to verify, or --all");
        return Outcome::WrongUsage;
    }
    if (request.records && !request.deep) {
        LogFile::errorf("--record takes digests of what --deep reads: give both");
        return Outcome::WrongUsage;
    }
    const std::unique_ptr<Kxg::Catalogue> database = openExistingDatabase();
    QVector<QByteArray> studyUIDs;
    if (database == nullptr)
        return Outcome::Failed;
    bool isDone = selection.all ? everyStudy(*database, studyUIDs)
                                : chooseStudies(*database, selection.studies, false, studyUIDs);
    CommandProgress progress("Verifying", !options.quiet);
    const auto report = [](const QString& fault) { LogFile::errorf("%s", qUtf8Printable(fault)); };
    StudyProof::Rules rules;
    rules.heals = request.heals;
    rules.records = request.records;
    rules.taken = [&progress](qint64) { return !progress.isCancelled(); };
    StudyProof proof(*database, rules, report);
    StudyCheck check(*database, progress, report);
    isDone = prove(request, proof, studyUIDs) && isDone;
    // Also the tag files of which the database knows nothing.
    if (selection.all)
        check.checkAll();
    for (int i = 0; i < studyUIDs.size() && !selection.all && !progress.isCancelled(); ++i)
        check.check(studyUIDs.at(i));
    tell(options, request, check.findings(), proof.findings());
    // Studies that were not reached are not verified, so an interrupt is a failure.
    const QByteArray finished = QByteArray::number(check.findings().studies) + " studies are verified";
    isDone = !toldOfInterrupt(finished.constData()) && isDone;
    const bool isSound =
        check.findings().differences == 0 && check.findings().unreadable == 0 && proof.findings().faults == 0;
    return isDone && isSound ? Outcome::Done : Outcome::Failed;
}

}  // namespace

void declareVerify(CommandSet& commands)
{
    const CommandText text = {"verify", kChecking,
                              "Hold tag files against the DICOM files they were made from",
                              "Every attribute of every image is compared, corrections taken into account, "
                              "and the tag files are held "
                              "against the database, byte by byte: a damaged one, an earlier one and one "
                              "that something else wrote are "
                              "told apart. Each difference is named; the exit code is 1 when there is one. "
                              "Without --heal and --record "
                              "nothing is changed.",
                              "kdd verify --all\n"
                              "kdd verify --all --deep --record       # once; later on without --record\n"
                              "kdd verify --all --heal                # build what is not as it was written\n"
                              "kdd --json verify 2.25.2062            # counts for a script"};
    const auto request = std::make_shared<VerifyRequest>();
    ArgumentList arguments = commands.declare(
        text, [request](const GlobalOptions& options) { return runVerify(options, *request); });
    request->selection.addTo(arguments);
    arguments.flag("--deep", request->deep,
                   "Also all bytes of DICOM and volume files, by the digests that the database has of them");
    arguments.flag("--record", request->records, "With --deep: keep digests of files that have none");
    arguments.flag("--heal", request->heals,
                   "Build tag files anew that are missing, damaged or not those written last");
}

}  // namespace Kdd
