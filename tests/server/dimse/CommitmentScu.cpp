// Asks a server of this machine for storage commitment as a modality does, and prints what it is told.
//
//     commitment_scu PORT TITLE TRANSACTION LISTEN CLASS=INSTANCE...
//
// With a port to listen at it leaves when its request was taken, and is called there; with 0 it waits.

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctk.h>
#include <dcmtk/dcmnet/scp.h>
#include <dcmtk/dcmnet/scu.h>

#include <cstdio>
#include <cstdlib>
#include <string>

namespace
{

constexpr int kPatience = 60;  // [s]

const char* const kClass = UID_StorageCommitmentPushModelSOPClass;

OFList<OFString> syntaxes()
{
    OFList<OFString> made;
    made.push_back(UID_LittleEndianImplicitTransferSyntax);
    return made;
}

void print(DcmDataset& told, const DcmTagKey& key, const char* word)
{
    DcmItem* item = nullptr;
    for (long i = 0; told.findAndGetSequenceItem(key, item, i).good(); ++i) {
        OFString uid;
        OFString title;
        Uint16 reason = 0;
        item->findAndGetOFString(DCM_ReferencedSOPInstanceUID, uid);
        item->findAndGetOFString(DCM_RetrieveAETitle, title);
        if (item->findAndGetUint16(DCM_FailureReason, reason).good())
            std::printf("%s %s %04X\n", uid.c_str(), word, unsigned(reason));
        else
            std::printf("%s %s%s%s\n", uid.c_str(), word, title.empty() ? "" : " at ", title.c_str());
    }
}

void print(Uint16 event, DcmDataset& told)
{
    OFString transaction;
    told.findAndGetOFString(DCM_TransactionUID, transaction);
    std::printf("event %u of %s\n", unsigned(event), transaction.c_str());
    print(told, DCM_ReferencedSOPSequence, "kept");
    print(told, DCM_FailedSOPSequence, "failed");
}

/// Is called by the server once.
class Listener : public DcmSCP
{
public:
    OFBool wasTold = OFFalse;

protected:
    OFCondition handleIncomingCommand(T_DIMSE_Message* message,
                                      const DcmPresentationContextInfo& context) override
    {
        if (message->CommandField != DIMSE_N_EVENT_REPORT_RQ)
            return DIMSE_BADCOMMANDTYPE;
        DcmDataset* told = nullptr;
        Uint16 event = 0;
        const OFCondition came =
            handleEVENTREPORTRequest(message->msg.NEventReportRQ, context.presentationContextID, told, event);
        if (told != nullptr)
            print(event, *told);
        wasTold = came.good();
        delete told;
        return came;
    }
    OFBool stopAfterCurrentAssociation() override { return wasTold; }
};

int fail(const char* what, const OFCondition& condition)
{
    std::printf("%s: %s\n", what, condition.text());
    return 1;
}

}  // namespace

int main(int argc, char** argv)
{
    if (argc < 6)
        return 2;
    const auto port = static_cast<Uint16>(std::atoi(argv[4]));
    Listener listener;
    listener.setPort(port);
    listener.setAETitle(argv[2]);
    listener.setConnectionBlockingMode(DUL_BLOCK);
    listener.addPresentationContext(kClass, syntaxes(), ASC_SC_ROLE_SCP);
    if (port != 0 && listener.openListenPort().bad())
        return 2;

    DcmSCU asker;
    asker.setAETitle(argv[2]);
    asker.setPeerAETitle("KDD");
    asker.setPeerHostName("127.0.0.1");
    asker.setPeerPort(static_cast<Uint16>(std::atoi(argv[1])));
    asker.setDIMSETimeout(kPatience);
    asker.addPresentationContext(kClass, syntaxes());
    OFCondition condition = asker.initNetwork();
    if (condition.good())
        condition = asker.negotiateAssociation();
    if (condition.bad())
        return fail("no association", condition);
    DcmDataset request;
    request.putAndInsertString(DCM_TransactionUID, argv[3]);
    for (int i = 5; i < argc; ++i) {
        const std::string named = argv[i];
        DcmItem* item = nullptr;
        request.findOrCreateSequenceItem(DCM_ReferencedSOPSequence, item, -2);
        item->putAndInsertString(DCM_ReferencedSOPClassUID, named.substr(0, named.find('=')).c_str());
        item->putAndInsertString(DCM_ReferencedSOPInstanceUID, named.substr(named.find('=') + 1).c_str());
    }
    Uint16 status = 0;
    condition = asker.sendACTIONRequest(asker.findPresentationContextID(kClass, ""),
                                        UID_StorageCommitmentPushModelSOPInstance, 1, &request, status);
    if (condition.bad())
        return fail("no answer", condition);
    std::printf("status %04X\n", unsigned(status));
    if (status == 0 && port == 0) {
        DcmDataset* told = nullptr;
        Uint16 event = 0;
        condition = asker.handleEVENTREPORTRequest(told, event, kPatience);
        if (told != nullptr)
            print(event, *told);
        delete told;
        if (condition.bad())
            return fail("not told", condition);
    }
    asker.releaseAssociation();
    if (status == 0 && port != 0)
        listener.acceptAssociations();
    return 0;
}
