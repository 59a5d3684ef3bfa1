#include "server/dimse/RetrieveSender.h"

#include "server/dicomweb/retrieve/BodyBlocks.h"
#include "server/dicomweb/retrieve/InstanceParts.h"

#include <dcmtk/dcmdata/dcostrmb.h>
#include <dcmtk/dcmdata/dctk.h>
#include <dcmtk/dcmdata/dcwcache.h>
#include <kddlib/LogFile.h>

#include <algorithm>
#include <cstring>

namespace Kdd::Dimse
{
namespace
{

using namespace DicomWeb;

constexpr int kTaken = 1000;  // all that is taken is taken alike

/// Whoever takes less for the length of an object holds a place and takes nothing [bytes/s].
constexpr qint64 kLeastRate = 1024;

/// Larger objects that have to be converted are made twice, and not kept in memory meanwhile [bytes].
constexpr int kMostKept = 16 * 1024 * 1024;

InstanceForm formOf(const std::vector<SendContext>& contexts, const QByteArray& sopClass)
{
    InstanceForm form;
    for (const SendContext& context : contexts) {
        if (context.sopClass == sopClass)
            form.syntaxes.append({context.transferSyntax, kTaken});
    }
    return form;
}

bool isMadeOnItsWay(const Http::BodyPart& part)
{
    return std::holds_alternative<std::unique_ptr<Http::Producer>>(part);
}

/// Takes all of it; `kept` is what it is, or null when that is too much to be kept.
Result drain(std::vector<Http::BodyPart> body, QByteArray& kept)
{
    BodyBlocks blocks(std::move(body));
    QByteArray block;
    Result result;
    bool isKept = true;
    kept = QByteArray("");
    do {
        result = blocks.next(block);
        isKept = isKept && kept.size() + block.size() <= kMostKept;
        kept = isKept ? kept + block : QByteArray();
    } while (result.good() && !block.isEmpty());
    return result;
}

/// A message that has begun cannot be taken back, so whatever is decoded or encoded is seen to come to its end before.
Verdict makeWhole(const ServedStudy& study, const RetrieveItem& item, const InstanceForm& form,
                  ObjectShelf& objects, std::vector<Http::BodyPart>& body, MadeInstance& made)
{
    const Verdict verdict = makeInstance(study, item.image, form, objects, body, made);
    if (verdict.bad() || std::none_of(body.begin(), body.end(), isMadeOnItsWay))
        return verdict;
    QByteArray kept;
    const Result drained = drain(std::move(body), kept);
    body.clear();
    if (drained.bad())
        return {500, drained.text()};
    if (kept.isNull())
        return makeInstance(study, item.image, form, objects, body, made);
    body.emplace_back(kept);
    return {};
}

}  // namespace

Sent RetrieveSender::send(const ServedStudy& study, const RetrieveItem& item, ObjectShelf& objects,
                          const SendOrder& order)
{
    const InstanceForm form = formOf(mContexts, item.sopClass);
    const auto fail = [&](const QString& reason) {
        LogFile::warnf("Image %s is not sent: %s", item.image.sopUID.constData(), qUtf8Printable(reason));
        return Sent::Failed;
    };
    if (form.syntaxes.isEmpty() || item.image.sopUID.isEmpty())
        return fail(QStringLiteral("The other side takes no objects of class %1")
                        .arg(QString::fromLatin1(item.sopClass)));
    std::vector<Http::BodyPart> body;
    MadeInstance made;
    const Verdict verdict = makeWhole(study, item, form, objects, body, made);
    if (verdict.bad())
        return fail(verdict.reason);
    const auto context = std::find_if(mContexts.begin(), mContexts.end(), [&](const SendContext& each) {
        return each.sopClass == item.sopClass && each.transferSyntax == made.syntaxUID;
    });
    if (context == mContexts.end())
        return fail(QStringLiteral("The other side does not take the form it is in"));
    const quint16 message = mAssociation.nextMsgID++;
    if (!sendCommand(*context, item, order, message))
        return Sent::Lost;
    const Sent sent = sendDataset(*context, std::move(body), made.metaLength, order.patience);
    return sent == Sent::Stored ? receiveAnswer(item, message) : sent;
}

bool RetrieveSender::sendBlock(const SendContext& context, DUL_DATAPDV kind, const char* bytes, int count,
                               bool isLast)
{
    DUL_PDV value = {};
    DUL_PDVLIST list = {};
    value.fragmentLength = static_cast<unsigned long>(count);
    value.presentationContextID = context.id;
    value.pdvType = kind;
    value.lastPDV = isLast ? OFTrue : OFFalse;
    value.data = const_cast<char*>(bytes);
    list.count = 1;
    list.pdv = &value;
    return DUL_WritePDVs(&mAssociation.DULassociation, &list).good();
}

/// DCMTK sends a command together with a dataset that it has in memory, or in a file. Ours is in neither.
bool RetrieveSender::sendCommand(const SendContext& context, const RetrieveItem& item, const SendOrder& order,
                                 quint16 message)
{
    constexpr quint16 kStore = 1;
    constexpr quint16 kHasDataset = 1;
    constexpr std::size_t kRoom = 4096;
    DcmDataset command;
    command.putAndInsertString(DCM_AffectedSOPClassUID, item.sopClass.constData());
    command.putAndInsertUint16(DCM_CommandField, kStore);
    command.putAndInsertUint16(DCM_MessageID, message);
    command.putAndInsertUint16(DCM_Priority, static_cast<Uint16>(order.priority));
    command.putAndInsertUint16(DCM_CommandDataSetType, kHasDataset);
    command.putAndInsertString(DCM_AffectedSOPInstanceUID, item.image.sopUID.constData());
    if (!order.originator.isEmpty()) {
        command.putAndInsertString(DCM_MoveOriginatorApplicationEntityTitle, order.originator.constData());
        command.putAndInsertUint16(DCM_MoveOriginatorMessageID, order.originatorMessage);
    }
    command.computeGroupLengthAndPadding(EGL_withGL, EPD_withoutPadding, EXS_LittleEndianImplicit,
                                         EET_ExplicitLength);
    std::vector<char> room(kRoom);
    DcmOutputBufferStream out(room.data(), static_cast<offile_off_t>(room.size()));
    DcmWriteCache cache;
    command.transferInit();
    const OFCondition written =
        command.write(out, EXS_LittleEndianImplicit, EET_ExplicitLength, &cache, EGL_withGL);
    command.transferEnd();
    void* bytes = nullptr;
    offile_off_t count = 0;
    out.flushBuffer(bytes, count);
    return written.good() &&
           sendBlock(context, DUL_COMMANDPDV, static_cast<const char*>(bytes), static_cast<int>(count), true);
}

Sent RetrieveSender::sendDataset(const SendContext& context, std::vector<Http::BodyPart> body, qint64 skipped,
                                 std::chrono::seconds patience)
{
    const auto begun = std::chrono::steady_clock::now();
    const qint64 before = mSentBytes;
    const auto isTooSlow = [&] {
        return std::chrono::steady_clock::now() - begun >
               patience + std::chrono::seconds((mSentBytes - before) / kLeastRate);
    };
    // Fragments are even, all of them.
    const int most = static_cast<int>(std::min<unsigned long>(mAssociation.sendPDVLength, 1 << 20)) & ~1;
    BodyBlocks blocks(std::move(body));
    QByteArray block;
    QByteArray waiting;
    while (true) {
        const Result result = blocks.next(block);
        if (result.bad()) {
            LogFile::errorf("An object broke off while it was sent: %s", qUtf8Printable(result.text()));
            return Sent::Lost;
        }
        if (block.isEmpty())
            break;
        const int passed = static_cast<int>(std::min<qint64>(skipped, block.size()));
        skipped -= passed;
        waiting.append(block.constData() + passed, block.size() - passed);
        int at = 0;
        // The last fragment says that it is, so one is kept back.
        for (; waiting.size() - at > most; at += most) {
            if (isTooSlow() || !sendBlock(context, DUL_DATASETPDV, waiting.constData() + at, most, false))
                return Sent::Lost;
            mSentBytes += most;
        }
        waiting.remove(0, at);
    }
    mSentBytes += waiting.size();
    return sendBlock(context, DUL_DATASETPDV, waiting.constData(), waiting.size(), true) ? Sent::Stored
                                                                                         : Sent::Lost;
}

Sent RetrieveSender::receiveAnswer(const RetrieveItem& item, quint16 message)
{
    T_DIMSE_Message answer;
    do {
        std::memset(&answer, 0, sizeof answer);
        if (!mReceive(answer))
            return Sent::Lost;
        if (answer.CommandField == DIMSE_C_CANCEL_RQ)
            mCancelled = answer.msg.CCancelRQ.MessageIDBeingRespondedTo;
    } while (answer.CommandField == DIMSE_C_CANCEL_RQ);
    const T_DIMSE_C_StoreRSP& stored = answer.msg.CStoreRSP;
    if (answer.CommandField != DIMSE_C_STORE_RSP || stored.MessageIDBeingRespondedTo != message ||
        stored.DataSetType != DIMSE_DATASET_NULL)
        return Sent::Lost;
    if (DICOM_SUCCESS_STATUS(stored.DimseStatus))
        return Sent::Stored;
    LogFile::warnf("Image %s was sent and answered by status %04X", item.image.sopUID.constData(),
                   unsigned(stored.DimseStatus));
    return DICOM_WARNING_STATUS(stored.DimseStatus) ? Sent::Warned : Sent::Failed;
}

}  // namespace Kdd::Dimse
