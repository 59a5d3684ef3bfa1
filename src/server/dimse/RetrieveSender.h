#pragma once

#include "server/dimse/RetrieveList.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmnet/dimse.h>

#include <chrono>
#include <functional>

namespace Kdd::Dimse
{

/// For whom objects are sent, and how urgently.
struct SendOrder
{
    T_DIMSE_Priority priority = DIMSE_PRIORITY_MEDIUM;
    QByteArray originator;  ///< title of who asked for them to be sent to another; empty: to itself
    quint16 originatorMessage = 0;
    std::chrono::seconds patience{30};  ///< to take an object, beside a second for each so many bytes
};

/// Under which objects of a class can be sent in a transfer syntax.
struct SendContext
{
    quint8 id = 0;
    QByteArray sopClass;
    QByteArray transferSyntax;
};

enum class Sent {
    Stored,
    Warned,  ///< stored, with a remark
    Failed,
    Lost,  ///< and nothing more can be sent over the association
};

/// Sends objects over an association by C-STORE, each as a retrieval over HTTP would give it, in blocks as it is made. Used
/// by the thread of the association.
class RetrieveSender
{
public:
    /// Receives the message that comes next; false: the association is lost.
    using Receive = std::function<bool(T_DIMSE_Message&)>;

    /// The association, which outlives the object, has agreed on the contexts.
    RetrieveSender(T_ASC_Association& association, std::vector<SendContext> contexts, Receive receive)
        : mAssociation(association)
        , mContexts(std::move(contexts))
        , mReceive(std::move(receive))
    {
    }

    /// Sends one, as stored where the other side takes that, else in another syntax that it takes. The log tells why when it
    /// fails.
    Sent send(const DicomWeb::ServedStudy& study, const RetrieveItem& item, DicomWeb::ObjectShelf& objects,
              const SendOrder& order);

    /// Whether the other side asked meanwhile to cancel the message of that number.
    bool isCancelled(quint16 message) const { return mCancelled == message; }

    qint64 sentBytes() const { return mSentBytes; }

private:
    bool sendCommand(const SendContext& context, const RetrieveItem& item, const SendOrder& order,
                     quint16 message);
    Sent sendDataset(const SendContext& context, std::vector<Http::BodyPart> body, qint64 skipped,
                     std::chrono::seconds patience);
    bool sendBlock(const SendContext& context, DUL_DATAPDV kind, const char* bytes, int count, bool isLast);
    Sent receiveAnswer(const RetrieveItem& item, quint16 message);

    T_ASC_Association& mAssociation;
    std::vector<SendContext> mContexts;
    Receive mReceive;
    int mCancelled = -1;
    qint64 mSentBytes = 0;
};

}  // namespace Kdd::Dimse
