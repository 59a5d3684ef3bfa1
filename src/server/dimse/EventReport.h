#pragma once

#include <QByteArray>

#include <functional>
#include <memory>

class DcmDataset;
struct T_ASC_Association;
struct T_DIMSE_Message;

namespace Kdd::Dimse
{

/// Something that another application entity is told by a message of ours (N-EVENT-REPORT).
struct EventReport
{
    QByteArray sopClass;
    QByteArray sopInstance;
    quint16 event = 0;

    /// Makes the dataset that goes with it, which may be large: it is made when it is sent.
    std::function<std::unique_ptr<DcmDataset>()> content;

    /// Sends it; false: the association is lost.
    bool send(T_ASC_Association& association, quint8 context, quint16 message) const;
};

/// Whether `answer` is that to the report of that number; a status that says no is logged.
bool isReportAnswer(const T_DIMSE_Message& answer, quint16 message);

}  // namespace Kdd::Dimse
