#pragma once

#include "server/dimse/AssociationRules.h"

#include <optional>

struct T_DIMSE_Message;

namespace Kdd::Dimse
{

class Association;

/// What was agreed on for messages under one number.
struct PresentationContext
{
    quint8 id = 0;
    QByteArray sopClass;        ///< abstract syntax
    QByteArray transferSyntax;  ///< UID, in which datasets come and go
    bool isTaken = true;        ///< messages of the class come here
    bool isSent = false;        ///< objects of the class may be sent here to the other side
};

/// A message that came, without the dataset that may follow it.
struct Command
{
    T_DIMSE_Message& message;
    const PresentationContext& context;
};

/// Answers the messages of some SOP classes. One object serves all associations, each on a thread of its own at the same
/// time.
class ServiceProvider
{
public:
    virtual ~ServiceProvider() = default;

    /// Whether messages of the class are answered.
    virtual bool provides(const QByteArray& sopClass) const = 0;

    /// Whether objects of the class are sent to who asked for the role of taking them, over the association itself.
    virtual bool sends(const QByteArray& /*sopClass*/) const { return false; }

    /// What the caller needs to be let into such a presentation context; without a value nothing.
    virtual std::optional<Right> right() const = 0;

    /// One of those that the other side can write (or read, where we send), in its order of preference; empty: none will do.
    /// The default is for datasets that are made anew: Explicit VR Little Endian, else Implicit VR Little Endian.
    virtual QByteArray chooseTransferSyntax(const QVector<QByteArray>& proposed) const;

    /// Receives the dataset that follows, if any, and answers. False: the association cannot go on and is aborted.
    virtual bool handle(const Command& command, Association& association) = 0;
};

}  // namespace Kdd::Dimse
