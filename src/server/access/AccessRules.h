#pragma once

#include "server/access/Caller.h"
#include "server/dicomweb/search/StudyRule.h"

#include <QHash>
#include <QString>
#include <QVector>

#include <kddlib/Result.h>

#include <chrono>
#include <optional>
#include <vector>

namespace Kdd::Access
{

/// What a token gives that has a value in a claim.
struct ClaimRule
{
    QString claim;  ///< its name, or a path with points into objects; empty: every token gives this
    QString value;  ///< the claim, a word of it, or an item of its list
    Rights gives;
};

/// Whoever brings a token sees the studies alone whose attribute has one of the values of the claim; all when one of these is
/// "*", and none when there are none.
struct ClaimLimit
{
    QString claim;  ///< as above: a text or a list of texts
    DicomWeb::StudyRule rule;
};

/// Which tokens are good, and for what.
struct TokenRules
{
    QString issuer;
    QVector<QString> audiences;       ///< any of which a token has to be meant for
    QByteArray keys;                  ///< address of the issuer's key set, or a file with it
    QByteArray caFile;                ///< PEM, by which that address has to prove itself; empty: as elsewhere
    std::chrono::seconds leeway{60};  ///< by which clocks may differ
    std::chrono::seconds keysAge{3600};       ///< after which keys are asked for again
    std::chrono::seconds keysKept{86400};     ///< for which they serve when they cannot be asked for
    QString subject = QStringLiteral("sub");  ///< claim that tells who it is
    QVector<ClaimRule> rights;
    std::vector<ClaimLimit> studies;  ///< all hold; none: every study
};

/// Rights by name; "*" stands for everybody who has a name.
using NamedRights = QHash<QByteArray, Rights>;

/// Who stands in front of the server and says who asks.
struct HeaderRules
{
    QByteArray name;            ///< of the header, in small letters
    QVector<QByteArray> peers;  ///< numeric addresses of those who are believed
    NamedRights users;
};

/// Whose certificates are believed.
struct CertificateRules
{
    QByteArray caFile;  ///< PEM
    NamedRights subjects;
};

/// How people sign in with a browser, at the provider that issues the tokens.
struct SignInRules
{
    QString client;      ///< the name by which the provider knows this server
    QString secretFile;  ///< what both of them know; empty: nothing
    QString scope = QStringLiteral("openid profile");
    QByteArray discovery;                    ///< address of what the provider tells of itself
    QString sessionKeys;                     ///< file of the keys that seal sessions
    std::chrono::seconds session{8 * 3600};  ///< after which one has to sign in again
};

/// Which pages of other origins may read answers.
struct OriginRules
{
    QVector<QByteArray> origins;  ///< "https://viewer.example.org"
    std::chrono::seconds maxAge{7200};
};

/// Where audit messages go.
struct SyslogRules
{
    enum class By { Tls, Udp, Socket };

    By by = By::Tls;
    QByteArray host;  ///< or the path of a socket
    QByteArray port;
    QByteArray caFile;  ///< PEM, by which the receiver has to prove itself; empty: those of the system
};

/// Who may what.
struct AccessRules
{
    Rights anyone;  ///< without saying who he is
    std::optional<TokenRules> tokens;
    std::optional<HeaderRules> header;
    std::optional<CertificateRules> certificates;
    std::optional<SignInRules> signIn;  ///< where there are tokens
    OriginRules origins;
    QByteArray audit;  ///< file of the audit trail, "log": the log; empty: there is none
    std::optional<SyslogRules> syslog;

    /// Everybody may do everything.
    static AccessRules open();

    /// Reads an access file (JSON). False, with the name of what is wrong in it, when it is none: a slip must not open a
    /// door.
    static Result read(const QString& path, AccessRules& rules);
    static Result parse(const QByteArray& text, AccessRules& rules);
};

}  // namespace Kdd::Access
