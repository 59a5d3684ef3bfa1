#include "server/dimse/Association.h"

#include "server/dimse/MetaHeader.h"
#include "server/dimse/SinkStream.h"

#include <dcmtk/dcmdata/dctk.h>
#include <dcmtk/dcmnet/cond.h>
#include <kddlib/DicomFileReader.h>
#include <kddlib/LogFile.h>

#include <algorithm>
#include <cstring>

namespace Kdd::Dimse
{
namespace
{

/// Studies of one method that are kept for the report of an association.
constexpr int kMostStudies = 100;

/// How long the other side may take to end the connection, after it was told that the association has ended [s].
constexpr int kLeaving = 5;

// Who ends an association.
constexpr unsigned char kByProvider = 2;

QByteArray trimmed(const char* text)
{
    return QByteArray(text).trimmed();
}

/// DCMTK takes what it was told for what can be told: a text of the other side stays on one line.
QByteArray shown(QByteArray text)
{
    for (char& letter : text) {
        if (letter < ' ' || letter > '~')
            letter = '?';
    }
    return text;
}

}  // namespace

Association::Association(DcmtkAssociation dcmtk, PeerConnection& connection, Caller caller,
                         const DimseSettings& settings, const Providers& providers,
                         AssociationObserver& observer, quint64 id)
    : mDcmtk(std::move(dcmtk))
    , mConnection(connection)
    , mSettings(settings)
    , mProviders(providers)
    , mObserver(observer)
{
    const DUL_ASSOCIATESERVICEPARAMETERS& asked = mDcmtk->params->DULparams;
    mRecord.id = id;
    mRecord.caller = std::move(caller);
    mRecord.caller.title = shown(trimmed(asked.callingAPTitle));
    mRecord.caller.rights = settings.rules.rightsOf(mRecord.caller.title, mRecord.caller.address);
    mRecord.caller.studies = settings.rules.studiesOf(mRecord.caller.title);
    mRecord.called = shown(trimmed(asked.calledAPTitle));
}

Association::~Association()
{
    for (const WaitingReport& waiting : mReports)
        waiting.ended(false);
    mRecord.duration = std::chrono::steady_clock::now() - mBegun;
    mObserver.ended(mRecord);
}

// ---- being let in

void Association::run()
{
    if (!isWelcome() || !negotiate())
        return;
    mRecord.isAccepted = true;
    while (answerNext()) {
    }
}

void Association::rejectForNow()
{
    reject(ASC_RESULT_REJECTEDTRANSIENT, ASC_REASON_SP_PRES_LOCALLIMITEXCEEDED,
           "there are as many associations as there may be");
}

bool Association::isWelcome()
{
    const auto fits = [&](const char* name) {
        return trimmed(mDcmtk->params->DULparams.applicationContextName) == name;
    };
    if (!fits(UID_StandardApplicationContext))
        reject(ASC_RESULT_REJECTEDPERMANENT, ASC_REASON_SU_APPCONTEXTNAMENOTSUPPORTED,
               "its application context is not DICOM's");
    else if (!mSettings.rules.isCalledBy(mRecord.called))
        reject(ASC_RESULT_REJECTEDPERMANENT, ASC_REASON_SU_CALLEDAETITLENOTRECOGNIZED,
               "nobody is called that here");
    else if (!mRecord.caller.rights)
        reject(ASC_RESULT_REJECTEDPERMANENT, ASC_REASON_SU_CALLINGAETITLENOTRECOGNIZED,
               "the rules know no such caller at that address");
    else
        return true;
    return false;
}

void Association::reject(T_ASC_RejectParametersResult result, T_ASC_RejectParametersReason reason,
                         const char* why)
{
    LogFile::warnf("Association %llu of \"%s\" (%s) with \"%s\" is rejected: %s", mRecord.id,
                   mRecord.caller.title.constData(), mRecord.caller.address.constData(),
                   mRecord.called.constData(), why);
    T_ASC_RejectParameters parameters = {result, static_cast<T_ASC_RejectParametersSource>(reason >> 8),
                                         reason};
    if (ASC_rejectAssociation(mDcmtk.get(), &parameters).good())
        ASC_dataWaiting(mDcmtk.get(), kLeaving);
}

bool Association::negotiate()
{
    T_ASC_Parameters* const parameters = mDcmtk->params;
    const int count = ASC_countPresentationContexts(parameters);
    for (int i = 0; i < count; ++i) {
        T_ASC_PresentationContext proposed = {};
        if (ASC_getPresentationContext(parameters, i, &proposed).good())
            negotiate(proposed);
    }
    ASC_setAPTitles(parameters, nullptr, nullptr, parameters->DULparams.calledAPTitle);
    mConnection.beginMessage();
    return ASC_acknowledgeAssociation(mDcmtk.get()).good();
}

bool Association::isAllowed(const ServiceProvider* provider) const
{
    return provider != nullptr && (!provider->right() || mRecord.caller.rights.testFlag(*provider->right()));
}

void Association::negotiate(const T_ASC_PresentationContext& proposed)
{
    const QByteArray sopClass = trimmed(proposed.abstractSyntax);
    const auto find = [&](bool (ServiceProvider::*offers)(const QByteArray&)
                              const) -> const ServiceProvider* {
        for (const auto& provider : mProviders) {
            if ((provider.get()->*offers)(sopClass))
                return provider.get();
        }
        return nullptr;
    };
    const T_ASC_SC_ROLE role = proposed.proposedRole;
    const ServiceProvider* taker = role == ASC_SC_ROLE_SCP ? nullptr : find(&ServiceProvider::provides);
    const ServiceProvider* sender =
        role == ASC_SC_ROLE_SCP || role == ASC_SC_ROLE_SCUSCP ? find(&ServiceProvider::sends) : nullptr;
    const bool isKnown = taker != nullptr || sender != nullptr;
    taker = isAllowed(taker) ? taker : nullptr;
    sender = isAllowed(sender) ? sender : nullptr;

    T_ASC_Parameters* const parameters = mDcmtk->params;
    const auto refuse = [&](T_ASC_P_ResultReason reason) {
        ASC_refusePresentationContext(parameters, proposed.presentationContextID, reason);
    };
    if (taker == nullptr && sender == nullptr)
        return refuse(isKnown ? ASC_P_USERREJECTION : ASC_P_ABSTRACTSYNTAXNOTSUPPORTED);
    QVector<QByteArray> syntaxes;
    for (int i = 0; i < proposed.transferSyntaxCount; ++i)
        syntaxes.append(trimmed(proposed.proposedTransferSyntaxes[i]));
    PresentationContext context;
    context.id = proposed.presentationContextID;
    context.sopClass = sopClass;
    context.transferSyntax = (taker != nullptr ? taker : sender)->chooseTransferSyntax(syntaxes);
    context.isTaken = taker != nullptr;
    context.isSent = sender != nullptr;
    if (context.transferSyntax.isEmpty())
        return refuse(ASC_P_TRANSFERSYNTAXESNOTSUPPORTED);
    const T_ASC_SC_ROLE accepted = role == ASC_SC_ROLE_SCUSCP && sender == nullptr  ? ASC_SC_ROLE_SCU
                                   : role == ASC_SC_ROLE_SCUSCP && taker == nullptr ? ASC_SC_ROLE_SCP
                                                                                    : role;
    if (ASC_acceptPresentationContext(parameters, context.id, context.transferSyntax.constData(), accepted)
            .good())
        mContexts.push_back(context);
}

// ---- messages

const PresentationContext* Association::contextOf(int id) const
{
    const auto found = std::find_if(mContexts.begin(), mContexts.end(),
                                    [&](const PresentationContext& context) { return context.id == id; });
    return found == mContexts.end() ? nullptr : &*found;
}

const PresentationContext* Association::contextToSend(const QByteArray& sopClass,
                                                      const QByteArray& transferSyntax) const
{
    const auto found =
        std::find_if(mContexts.begin(), mContexts.end(), [&](const PresentationContext& context) {
            return context.isSent && context.sopClass == sopClass && context.transferSyntax == transferSyntax;
        });
    return found == mContexts.end() ? nullptr : &*found;
}

void Association::abort()
{
    mConnection.sendAbort(kByProvider, 0);
    mConnection.close();
}

bool Association::answerNext()
{
    switch (mConnection.await(restTime())) {
    case PeerConnection::Came::Nothing:
        return endRest();
    case PeerConnection::Came::Stop:
        abort();
        return false;
    case PeerConnection::Came::Something:
        break;
    }
    return receiveNext();
}

std::chrono::milliseconds Association::restTime() const
{
    if (mReports.empty())
        return mSettings.idle;
    return mReports.front().message ? std::chrono::milliseconds(mSettings.patience) : mSettings.linger;
}

/// Whoever says nothing waits for something, or for nothing any more.
bool Association::endRest()
{
    if (!mReports.empty() && !mReports.front().message && sendReport(mReports.front()))
        return true;
    LogFile::printf("Association %llu of \"%s\" has ended: nothing came for %lld ms", mRecord.id,
                    mRecord.caller.title.constData(), static_cast<long long>(restTime().count()));
    abort();
    return false;
}

bool Association::receiveNext()
{
    mConnection.beginMessage();
    T_ASC_PresentationContextID id = 0;
    T_DIMSE_Message message;
    std::memset(&message, 0, sizeof message);
    DcmDataset* detail = nullptr;
    const OFCondition came = DIMSE_receiveCommand(mDcmtk.get(), DIMSE_BLOCKING, 0, &id, &message, &detail);
    const std::unique_ptr<DcmDataset> owned(detail);
    if (came.bad()) {
        endBy(came);
        return false;
    }
    if (answer(id, message))
        return true;
    abort();
    return false;
}

void Association::endBy(const OFCondition& condition)
{
    if (condition == DUL_PEERREQUESTEDRELEASE) {
        mRecord.isReleased = true;
        ASC_acknowledgeRelease(mDcmtk.get());
        ASC_dataWaiting(mDcmtk.get(), kLeaving);
        return;
    }
    if (condition == DUL_PEERABORTEDASSOCIATION)
        LogFile::printf("Association %llu of \"%s\" was aborted by the other side", mRecord.id,
                        mRecord.caller.title.constData());
    else
        LogFile::warnf("Association %llu of \"%s\" (%s) broke off: %s", mRecord.id,
                       mRecord.caller.title.constData(), mRecord.caller.address.constData(),
                       shown(condition.text()).constData());
    if (condition != DUL_PEERABORTEDASSOCIATION && condition != DUL_NETWORKCLOSED)
        abort();
}

bool Association::answer(T_ASC_PresentationContextID id, T_DIMSE_Message& message)
{
    // What is asked to be cancelled has been answered by now.
    if (message.CommandField == DIMSE_C_CANCEL_RQ)
        return true;
    if (message.CommandField == DIMSE_N_EVENT_REPORT_RSP && endReport(message))
        return true;
    const PresentationContext* const context = contextOf(id);
    if (context != nullptr && context->isTaken) {
        for (const auto& provider : mProviders) {
            if (provider->provides(context->sopClass))
                return provider->handle({message, *context}, *this);
        }
    }
    LogFile::warnf("Association %llu of \"%s\" (%s) is aborted: a message came for which nothing was agreed",
                   mRecord.id, mRecord.caller.title.constData(), mRecord.caller.address.constData());
    return false;
}

bool Association::receive(const Command& command, DcmOutputStream& stream, qint64 most)
{
    mConnection.expectDataset(most);
    T_ASC_PresentationContextID id = command.context.id;
    const OFCondition received =
        DIMSE_receiveDataSetInFile(mDcmtk.get(), DIMSE_BLOCKING, 0, &id, &stream, nullptr, nullptr);
    mConnection.expectDataset(PduLimits().dataset);
    if (received.bad()) {
        LogFile::warnf("Association %llu of \"%s\" (%s): what it sent is lost: %s", mRecord.id,
                       mRecord.caller.title.constData(), mRecord.caller.address.constData(),
                       shown(received.text()).constData());
        return false;
    }
    return id == command.context.id;
}

std::unique_ptr<DcmDataset> Association::receiveIdentifier(const Command& command, bool& isGood, qint64 most)
{
    // Read as a file is, with which the library sees how deep items lie inside each other: DCMTK recurses for each level.
    MetaHeader meta;
    meta.sopClass = command.context.sopClass;
    meta.sopInstance = command.context.sopClass;
    meta.transferSyntax = command.context.transferSyntax;
    QByteArray bytes = meta.bytes();
    qint64 size = 0;
    SinkStream stream([&](const char* from, qint64 count) {
        size += count;
        if (size <= most)
            bytes.append(from, static_cast<int>(count));
    });
    if (!receive(command, stream, std::max(PduLimits().dataset, 2 * most)))
        return nullptr;
    DcmFileFormat file;
    isGood = size <= most && (size == 0 || readDicomBuffer(bytes, file).good()) &&
             file.loadAllDataIntoMemory().good();
    std::unique_ptr<DcmDataset> dataset(isGood ? file.getAndRemoveDataset() : nullptr);
    return dataset != nullptr ? std::move(dataset) : std::make_unique<DcmDataset>();
}

bool Association::send(const PresentationContext& context, T_DIMSE_Message& message, DcmDataset* dataset,
                       DcmDataset* detail)
{
    return DIMSE_sendMessageUsingMemoryData(mDcmtk.get(), context.id, &message, detail, dataset, nullptr,
                                            nullptr)
        .good();
}

bool Association::isCancelled(const PresentationContext& context, quint16 messageId)
{
    mConnection.beginMessage();
    return DIMSE_checkForCancelRQ(mDcmtk.get(), context.id, messageId).good();
}

bool Association::receiveAnswer(T_DIMSE_Message& answer)
{
    mConnection.beginMessage();
    T_ASC_PresentationContextID id = 0;
    DcmDataset* detail = nullptr;
    std::memset(&answer, 0, sizeof answer);
    const OFCondition came = DIMSE_receiveCommand(mDcmtk.get(), DIMSE_BLOCKING, 0, &id, &answer, &detail);
    const std::unique_ptr<DcmDataset> owned(detail);
    return came.good() && contextOf(id) != nullptr;
}

void Association::report(const PresentationContext& context, EventReport report,
                         std::function<void(bool)> ended)
{
    mReports.push_back({context.id, std::move(report), std::move(ended), std::nullopt});
}

bool Association::sendReport(WaitingReport& waiting)
{
    waiting.message = mDcmtk->nextMsgID++;
    return waiting.report.send(*mDcmtk, waiting.context, *waiting.message);
}

/// False: nobody asked for that answer.
bool Association::endReport(const T_DIMSE_Message& answer)
{
    if (mReports.empty() || !mReports.front().message || !isReportAnswer(answer, *mReports.front().message))
        return false;
    const WaitingReport ended = std::move(mReports.front());
    mReports.pop_front();
    ended.ended(true);
    return true;
}

void Association::note(const Performed& performed)
{
    MethodCount& count = mRecord.methods[performed.method];
    ++(performed.isDone ? count.done : count.failed);
    count.bytes += performed.bytes;
    if (!performed.studyUID.isEmpty() && !count.studies.contains(performed.studyUID)) {
        count.hasMoreStudies = count.studies.size() >= kMostStudies;
        if (!count.hasMoreStudies)
            count.studies.insert(performed.studyUID);
    }
    mObserver.performed(performed);
}

}  // namespace Kdd::Dimse
