#include "server/access/AuditMessages.h"

#include "server/dicomweb/ResourcePath.h"

#include <QCryptographicHash>
#include <QDateTime>

#include <unistd.h>

#include <algorithm>

namespace Kdd::Access
{
namespace
{

constexpr auto kOnceIn = std::chrono::seconds(60);
constexpr int kMostTold = 10000;  // beyond it all are forgotten, and told once more

/// Security, normal but significant.
constexpr const char* kPriority = "<85>1 ";

/// An event, as the standard numbers it, and what is done: create, read, update, delete, execute.
struct Event
{
    const char* code;
    const char* name;
    char action;
    const char* type;  ///< its number and name, null: none
    const char* typeName;
};

constexpr Event kStart = {"110100", "Application Activity", 'E', "110120", "Application Start"};
constexpr Event kStop = {"110100", "Application Activity", 'E', "110121", "Application Stop"};
constexpr Event kLogin = {"110114", "User Authentication", 'E', "110122", "Login"};
constexpr Event kLogout = {"110114", "User Authentication", 'E', "110123", "Logout"};
constexpr Event kQuery = {"110112", "Query", 'E', nullptr, nullptr};
constexpr Event kStored = {"110104", "DICOM Instances Transferred", 'C', nullptr, nullptr};
constexpr Event kSent = {"110104", "DICOM Instances Transferred", 'R', nullptr, nullptr};
constexpr Event kSeen = {"110103", "DICOM Instances Accessed", 'R', nullptr, nullptr};
constexpr Event kChanged = {"110103", "DICOM Instances Accessed", 'U', nullptr, nullptr};
constexpr Event kRemoved = {"110103", "DICOM Instances Accessed", 'D', nullptr, nullptr};
constexpr Event kStudyRemoved = {"110105", "DICOM Study Deleted", 'D', nullptr, nullptr};

bool isOneOf(const char* kind, std::initializer_list<const char*> kinds)
{
    return std::any_of(kinds.begin(), kinds.end(),
                       [&](const char* each) { return qstrcmp(kind, each) == 0; });
}

const Event* readingOf(const Asked& asked)
{
    if (isOneOf(asked.kind, {"studies", "series", "instances", "patients", "changefeed"}))
        return &kQuery;
    if (isOneOf(asked.kind, {"objects", "frames", "bulkdata", "pixeldata", "rendered", "thumbnail", "wado"}))
        return &kSent;
    return asked.study.isEmpty() ? nullptr : &kSeen;
}

const Event* eventOf(const Http::Exchange& exchange, const Asked& asked)
{
    const QVector<QByteArray>& path = exchange.request.path;
    switch (exchange.request.method) {
    case Http::Method::Get:
    case Http::Method::Head:
        if (isOneOf(asked.kind, {"signin"}))
            return path.size() == 2 ? &kLogin : nullptr;
        return readingOf(asked);
    case Http::Method::Post:
        if (isOneOf(asked.kind, {"signout"}))
            return &kLogout;
        return isOneOf(asked.kind, {"corrections"}) ? &kChanged : &kStored;
    case Http::Method::Delete:
        return path.contains("series") ? &kRemoved : &kStudyRemoved;
    default:
        return nullptr;
    }
}

/// As the value of an attribute. What XML cannot say is left out.
QByteArray quoted(const QByteArray& text)
{
    QString kept;
    for (const QChar each : QString::fromUtf8(text))
        if (each >= QLatin1Char(' ') && each.unicode() < 0xFFFE)
            kept += each;
    return '"' + kept.toHtmlEscaped().toUtf8() + '"';
}

QByteArray coded(const char* element, const char* code, const char* name)
{
    return QByteArray("<") + element + " csd-code=\"" + code + "\" codeSystemName=\"DCM\" originalText=\"" +
           name + "\"/>";
}

QByteArray identified(const Event& event, int outcome, const QByteArray& time)
{
    QByteArray text =
        R"(<?xml version="1.0" encoding="UTF-8"?><AuditMessage><EventIdentification EventActionCode=")";
    text += event.action;
    text += "\" EventDateTime=\"" + time + "\" EventOutcomeIndicator=\"" + QByteArray::number(outcome) +
            "\">" + coded("EventID", event.code, event.name);
    if (event.type != nullptr)
        text += coded("EventTypeCode", event.type, event.typeName);
    return text + "</EventIdentification>";
}

QByteArray server(const QByteArray& host, const char* role, const char* roleName)
{
    return "<ActiveParticipant UserID=" + quoted("kdd@" + host) + " AlternativeUserID=\"" +
           QByteArray::number(static_cast<qlonglong>(::getpid())) + "\" UserIsRequestor=\"false\">" +
           coded("RoleIDCode", role, roleName) + "</ActiveParticipant>";
}

QByteArray source(const QByteArray& host)
{
    return "<AuditSourceIdentification AuditSourceID=" + quoted("kdd@" + host) + "/>";
}

QByteArray applicationMessage(const Event& event, const QByteArray& time, const QByteArray& host)
{
    return identified(event, 0, time) + server(host, "110150", "Application") + source(host) +
           "</AuditMessage>";
}

QByteArray presentTime()
{
    return QDateTime::currentDateTimeUtc().toString(Qt::ISODateWithMs).toLatin1();
}

QByteArray ownHost()
{
    char name[256] = "";
    ::gethostname(name, sizeof name - 1);
    QByteArray host;
    for (const char each : QByteArray(name))
        if (each > ' ' && each < '\x7f')
            host += each;
    return host.isEmpty() ? QByteArray("-") : host;
}

}  // namespace

QVector<QByteArray> AuditMessages::messagesOf(const Http::Exchange& exchange, const Asked& asked,
                                              const QByteArray& time, const QByteArray& host)
{
    const Event* const event = eventOf(exchange, asked);
    if (event == nullptr || exchange.status == 0)
        return {};
    const Http::Request& request = exchange.request;
    const bool isDone = exchange.status < 400;
    const bool isReceived = event == &kStored;
    const QByteArray user = exchange.caller.isEmpty() ? "unknown@" + request.peer : exchange.caller;
    const QByteArray begin = identified(*event, isDone ? 0 : (exchange.status >= 500 ? 8 : 4), time) +
                             "<ActiveParticipant UserID=" + quoted(user) +
                             " UserIsRequestor=\"true\" NetworkAccessPointID=" + quoted(request.peer) +
                             " NetworkAccessPointTypeCode=\"2\">" +
                             (isReceived ? coded("RoleIDCode", "110153", "Source Role ID")
                                         : coded("RoleIDCode", "110152", "Destination Role ID")) +
                             "</ActiveParticipant>" +
                             (isReceived ? server(host, "110152", "Destination Role ID")
                                         : server(host, "110153", "Source Role ID")) +
                             source(host);
    QVector<QByteArray> studies;
    const QVector<QByteArray> changed = exchange.effect ? exchange.effect->studies : QVector<QByteArray>();
    for (const QByteArray& study : QVector<QByteArray>{asked.study} + changed)
        if (DicomWeb::isUID(study) && !studies.contains(study))
            studies.append(study);
    QVector<QByteArray> messages;
    for (const QByteArray& study : qAsConst(studies))
        messages.append(begin + "<ParticipantObjectIdentification ParticipantObjectID=" + quoted(study) +
                        R"( ParticipantObjectTypeCode="2" ParticipantObjectTypeCodeRole="3">)" +
                        coded("ParticipantObjectIDTypeCode", "110180", "Study Instance UID") +
                        "</ParticipantObjectIdentification></AuditMessage>");
    if (messages.isEmpty())
        messages.append(begin + "</AuditMessage>");
    return messages;
}

AuditMessages::AuditMessages(const SyslogRules& rules, RightsTable table)
    : mTable(std::move(table))
    , mHost(ownHost())
    , mSender(rules)
{
    const QByteArray time = presentTime();
    send(applicationMessage(kStart, time, mHost), time);
}

AuditMessages::~AuditMessages()
{
    const QByteArray time = presentTime();
    send(applicationMessage(kStop, time, mHost), time);
}

void AuditMessages::ended(const Http::Exchange& exchange)
{
    // Without the time those are alike that tell the same.
    const QByteArray none;
    const QVector<QByteArray> alike = messagesOf(exchange, mTable.find(exchange.request), none, mHost);
    if (alike.isEmpty())
        return;
    const QByteArray time = presentTime();
    const QVector<QByteArray> messages = messagesOf(exchange, mTable.find(exchange.request), time, mHost);
    for (int i = 0; i < messages.size(); ++i)
        if (isNew(QCryptographicHash::hash(alike[i], QCryptographicHash::Sha256)))
            send(messages[i], time);
}

bool AuditMessages::isNew(const QByteArray& digest)
{
    const std::lock_guard<std::mutex> lock(mMutex);
    const auto now = std::chrono::steady_clock::now();
    const auto known = mTold.constFind(digest);
    if (known != mTold.constEnd() && now - *known < kOnceIn)
        return false;
    if (mTold.size() >= kMostTold)
        mTold.clear();
    mTold.insert(digest, now);
    return true;
}

void AuditMessages::send(const QByteArray& message, const QByteArray& time)
{
    // The three bytes say that it is UTF-8.
    mSender.send(kPriority + time + ' ' + mHost + " kdd " +
                 QByteArray::number(static_cast<qlonglong>(::getpid())) + " DICOM+RFC3881 - \xEF\xBB\xBF" +
                 message);
}

}  // namespace Kdd::Access
