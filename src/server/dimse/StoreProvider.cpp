#include "server/dimse/StoreProvider.h"

#include "server/dimse/Association.h"
#include "server/dimse/MetaHeader.h"
#include "server/dimse/SinkStream.h"

#include <dcmtk/dcmdata/dctk.h>
#include <kddlib/LogFile.h>

#include <cstring>

namespace Kdd::Dimse
{
namespace
{

const QByteArray kStandardRoot = "1.2.840.10008.";
const QByteArray kStorageRoot = "1.2.840.10008.5.1.4.1.1.";

constexpr quint16 kClassNotAgreed = 0x0122;
constexpr quint16 kCoerced = 0xB000;

/// What a sender is told: a status, and a comment of at most 64 letters.
struct Told
{
    quint16 status;
    const char* comment;
};

Told toldOf(ArrivalFault fault)
{
    switch (fault) {
    case ArrivalFault::None:
        return {STATUS_Success, nullptr};
    case ArrivalFault::OutOfSpace:
        return {0xA700, "The disk is nearly full"};
    case ArrivalFault::TooLarge:
        return {0xA700, "The object is larger than objects may be here"};
    case ArrivalFault::NotDicom:
        return {0xC000, "The dataset cannot be read, or lacks its UIDs"};
    case ArrivalFault::Mismatch:
        return {0xA900, "The dataset is of another class or instance"};
    case ArrivalFault::OtherStudy:
        return {0xA900, "The dataset is of another study"};
    case ArrivalFault::NotAllowed:
        return {0x0124, "Whoever sent it may not store it"};
    case ArrivalFault::OtherContent:
        return {0x0111, "There is another object of this SOP Instance UID"};
    case ArrivalFault::Failed:
        break;
    }
    return {0x0110, "It cannot be stored now"};
}

}  // namespace

bool isStorageClass(const QByteArray& sopClass, bool withUnknown)
{
    if (dcmIsaStorageSOPClassUID(sopClass.constData()) || sopClass.startsWith(kStorageRoot))
        return true;
    return withUnknown && !sopClass.startsWith(kStandardRoot) &&
           dcmFindNameOfUID(sopClass.constData()) == nullptr;
}

bool StoreProvider::provides(const QByteArray& sopClass) const
{
    return isStorageClass(sopClass, mTakesUnknownClasses);
}

QByteArray StoreProvider::chooseTransferSyntax(const QVector<QByteArray>& proposed) const
{
    QByteArray last;
    for (const QByteArray& syntax : proposed) {
        const E_TransferSyntax known = DcmXfer(syntax.constData()).getXfer();
        if (known == EXS_Unknown)
            continue;
        if (known != EXS_LittleEndianImplicit && known != EXS_BigEndianExplicit)
            return syntax;
        last = last.isEmpty() || known == EXS_LittleEndianImplicit ? syntax : last;
    }
    return last;
}

bool StoreProvider::handle(const Command& command, Association& association)
{
    const T_DIMSE_C_StoreRQ& request = command.message.msg.CStoreRQ;
    if (command.message.CommandField != DIMSE_C_STORE_RQ || request.DataSetType == DIMSE_DATASET_NULL)
        return false;
    MetaHeader meta;
    meta.sopClass = QByteArray(request.AffectedSOPClassUID).trimmed();
    meta.sopInstance = QByteArray(request.AffectedSOPInstanceUID).trimmed();
    meta.transferSyntax = command.context.transferSyntax;
    meta.sender = association.caller().title;
    const bool isAgreed = meta.sopClass == command.context.sopClass;

    std::unique_ptr<ObjectArrival> arrival = mArrivals.store().begin();
    const QByteArray header = meta.bytes();
    arrival->take(header.constData(), header.size());
    qint64 bytes = 0;
    SinkStream stream([&](const char* from, qint64 count) {
        bytes += count;
        // Of what cannot be taken the rest passes; committing tells why.
        if (isAgreed)
            arrival->take(from, count);
    });
    // Who does not know how large objects may be has begun to send, and waits for the answer behind the end.
    if (!association.receive(command, stream, 2 * mArrivals.store().rules().objectBytes)) {
        association.note({"C-STORE", false, {}, bytes});
        return false;
    }

    Told told = {kClassNotAgreed, "The object is of another class than was agreed on"};
    ArrivedObject object;
    if (isAgreed) {
        arrival->end();
        ObjectStore::Admission admits;
        if (const auto& studies = association.caller().studies)
            admits = [this, studies](const TagMap& image) { return mSight.admits(studies, image); };
        object = mRounds.commit(std::move(arrival), admits);
        told = toldOf(object.fault);
    }
    if (told.status != STATUS_Success)
        LogFile::warnf("Association %llu of \"%s\": object %s is not stored: %s", association.id(),
                       association.caller().title.constData(),
                       object.sopInstanceUID.isEmpty() ? "without name" : object.sopInstanceUID.constData(),
                       isAgreed ? qUtf8Printable(object.reason) : told.comment);
    else if (object.image != meta.sopInstance)
        told = {kCoerced, "It is shown under another SOP Instance UID"};
    association.note({"C-STORE", object.isStored() && isAgreed, object.studyUID, bytes});

    T_DIMSE_C_StoreRSP answer = {};
    answer.MessageIDBeingRespondedTo = request.MessageID;
    answer.DimseStatus = told.status;
    answer.DataSetType = DIMSE_DATASET_NULL;
    std::memcpy(answer.AffectedSOPClassUID, request.AffectedSOPClassUID, sizeof answer.AffectedSOPClassUID);
    std::memcpy(answer.AffectedSOPInstanceUID, request.AffectedSOPInstanceUID,
                sizeof answer.AffectedSOPInstanceUID);
    answer.opts = O_STORE_AFFECTEDSOPCLASSUID | O_STORE_AFFECTEDSOPINSTANCEUID;
    DcmDataset detail;
    if (told.comment != nullptr)
        detail.putAndInsertString(DCM_ErrorComment, told.comment);
    return DIMSE_sendStoreResponse(&association.dcmtk(), command.context.id, &request, &answer,
                                   told.comment == nullptr ? nullptr : &detail)
        .good();
}

}  // namespace Kdd::Dimse
