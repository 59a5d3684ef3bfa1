#pragma once

#include "server/dimse/Association.h"
#include "server/dimse/RetrieveSender.h"

namespace Kdd::Dimse
{

/// Where the objects of a retrieval go.
class RetrieveTarget
{
public:
    virtual ~RetrieveTarget() = default;

    /// Sends one of the items, in their order. Lost: nothing more can be sent to it.
    virtual Sent send(const std::vector<RetrieveItem>& items, std::size_t index,
                      const DicomWeb::ServedStudy& study) = 0;

    /// Whether the objects go over the association of the retrieval itself, which is lost with it.
    virtual bool isSameAssociation() const = 0;

    /// Whether it was noticed while sending that the retrieval is no longer wanted.
    virtual bool isCancelled() const { return false; }

    virtual qint64 sentBytes() const = 0;
};

/// A retrieval from its request to its last answer: C-MOVE and C-GET differ in where the objects go and by which name the
/// answers are called.
class RetrieveRun
{
public:
    /// Both outlive the object; the command is a C-MOVE-RQ or a C-GET-RQ.
    RetrieveRun(const Command& command, Association& association);

    /// Answers that nothing is sent. False, as of `run`: the association is lost.
    bool refuse(const QueryEnding& ending);

    /// Sends the items one after the other, with an answer behind each that tells how many are left.
    bool run(const std::vector<RetrieveItem>& items, const RetrieveSource& source, RetrieveTarget& target);

private:
    Sent sendNext(const std::vector<RetrieveItem>& items, std::size_t index, const RetrieveSource& source,
                  RetrieveTarget& target);
    void failFrom(const std::vector<RetrieveItem>& items, std::size_t index);
    void count(Sent sent, const RetrieveItem& item);
    QueryEnding ending() const;
    bool isCancelled(const RetrieveTarget& target);
    bool answer(const QueryEnding& ending);
    void note(const QueryEnding& ending, qint64 bytes);
    bool finish(const QueryEnding& ending, qint64 bytes);

    const Command& mCommand;
    Association& mAssociation;
    const bool mIsMove;
    const quint16 mMessage;

    QByteArray mStudyUID;  // of the one that is being sent
    std::shared_ptr<const DicomWeb::ServedStudy> mStudy;

    std::size_t mRemaining = 0;
    std::size_t mCompleted = 0;
    std::size_t mFailed = 0;
    std::size_t mWarned = 0;
    QByteArray mFailedUIDs;  // separated by "\"
};

/// Receives the identifier of a retrieval and lists what it names; false: the association is lost. `ending` tells whether
/// that could be done.
bool receiveRetrieval(const Command& command, Association& association, QueryRoot root,
                      const RetrieveSource& source, std::vector<RetrieveItem>& items, QueryEnding& ending);

}  // namespace Kdd::Dimse
