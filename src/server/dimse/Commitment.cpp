#include "server/dimse/Commitment.h"

#include "server/dicomweb/ResourcePath.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctk.h>

#include <algorithm>

namespace Kdd::Dimse
{
namespace
{

constexpr quint16 kInvalidValue = 0x0115;
constexpr quint16 kResourceLimitation = 0x0213;

quint16 failureReason(Custody custody)
{
    switch (custody) {
    case Custody::Unknown:
        return 0x0112;
    case Custody::OtherClass:
        return 0x0119;
    default:
        return 0x0110;
    }
}

QByteArray uidOf(DcmItem& item, const DcmTagKey& key)
{
    OFString uid;
    item.findAndGetOFStringArray(key, uid);
    return QByteArray(uid.c_str()).trimmed();
}

void addTo(DcmDataset& dataset, const DcmTagKey& sequence, const ObjectReference& object,
           const QByteArray& title)
{
    DcmItem* item = nullptr;
    if (dataset.findOrCreateSequenceItem(sequence, item, -2).bad())
        return;
    item->putAndInsertString(DCM_ReferencedSOPClassUID, object.sopClassUID.constData());
    item->putAndInsertString(DCM_ReferencedSOPInstanceUID, object.sopInstanceUID.constData());
    if (object.custody != Custody::Kept)
        item->putAndInsertUint16(DCM_FailureReason, failureReason(object.custody));
    // What a correction gave another UID is kept, but nobody gets it by the one that he knows.
    else if (object.image == object.sopInstanceUID)
        item->putAndInsertString(DCM_RetrieveAETitle, title.constData());
}

}  // namespace

QueryEnding Commitment::read(DcmItem& dataset, Commitment& commitment)
{
    commitment = {};
    commitment.transaction = uidOf(dataset, DCM_TransactionUID);
    if (!DicomWeb::isUID(commitment.transaction))
        return {kInvalidValue, QStringLiteral("The Transaction UID is missing, or is none")};
    DcmSequenceOfItems* sequence = nullptr;
    dataset.findAndGetSequence(DCM_ReferencedSOPSequence, sequence);
    if (sequence == nullptr || sequence->card() == 0)
        return {kInvalidValue, QStringLiteral("The Referenced SOP Sequence is missing or empty")};
    if (sequence->card() > kMostCommitmentObjects)
        return {kResourceLimitation, QStringLiteral("Too many objects are named at once")};
    // Item by item, for each look-up by number walks there from one end.
    for (DcmObject* next = sequence->nextInContainer(nullptr); next != nullptr;
         next = sequence->nextInContainer(next)) {
        auto& item = static_cast<DcmItem&>(*next);
        ObjectReference object;
        object.sopClassUID = uidOf(item, DCM_ReferencedSOPClassUID);
        object.sopInstanceUID = uidOf(item, DCM_ReferencedSOPInstanceUID);
        if (!DicomWeb::isUID(object.sopClassUID) || !DicomWeb::isUID(object.sopInstanceUID))
            return {kInvalidValue, QStringLiteral("A UID is missing, or is none")};
        commitment.objects.push_back(std::move(object));
    }
    return {};
}

bool Commitment::isWhole() const
{
    return std::all_of(objects.begin(), objects.end(),
                       [](const ObjectReference& object) { return object.custody == Custody::Kept; });
}

std::unique_ptr<DcmDataset> Commitment::answer(const QByteArray& title) const
{
    auto dataset = std::make_unique<DcmDataset>();
    dataset->putAndInsertString(DCM_TransactionUID, transaction.constData());
    for (const ObjectReference& object : objects)
        addTo(*dataset, object.custody == Custody::Kept ? DCM_ReferencedSOPSequence : DCM_FailedSOPSequence,
              object, title);
    return dataset;
}

}  // namespace Kdd::Dimse
