#pragma once

#include "server/dimse/AssociationRules.h"

#include <QSet>

#include <chrono>
#include <map>

namespace Kdd::Dimse
{

/// What one message did.
struct Performed
{
    const char* method = "";  ///< "C-STORE"; one of few
    bool isDone = true;       ///< as it was asked for
    QByteArray studyUID;      ///< that it was about; empty: of none, or of many
    qint64 bytes = 0;         ///< of datasets that came or went
};

/// The messages of one kind in an association, together.
struct MethodCount
{
    qint64 done = 0;
    qint64 failed = 0;
    qint64 bytes = 0;
    QSet<QByteArray> studies;  ///< the first ones
    bool hasMoreStudies = false;
};

/// An association that has ended, or was rejected.
struct AssociationRecord
{
    quint64 id = 0;  ///< by which log lines name it
    Caller caller;
    QByteArray called;
    bool isAccepted = false;
    bool isReleased = false;  ///< and did not break off
    std::chrono::steady_clock::duration duration{};
    std::map<const char*, MethodCount> methods;  ///< by the method's name
};

/// Is told of every association. Called on any thread, on several at the same time.
class AssociationObserver
{
public:
    virtual ~AssociationObserver() = default;
    virtual void performed(const Performed& performed) = 0;
    virtual void ended(const AssociationRecord& record) = 0;
};

}  // namespace Kdd::Dimse
