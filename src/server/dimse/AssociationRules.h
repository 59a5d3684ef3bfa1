#pragma once

#include <QByteArray>
#include <QFlags>
#include <QHash>
#include <QVector>

#include <kddlib/StudyLimits.h>

#include <memory>

namespace Kdd::Dimse
{

/// What an application entity may do. Asking whether the server is there is open to whoever gets an association.
enum class Right {
    Store = 1,     ///< send objects, and ask for them to be kept
    Query = 2,     ///< search
    Retrieve = 4,  ///< have objects sent, to itself or to another one
};
Q_DECLARE_FLAGS(Rights, Right)
Q_DECLARE_OPERATORS_FOR_FLAGS(Rights)

constexpr Rights kAllRights = Rights(Right::Store) | Right::Query | Right::Retrieve;

/// An application entity that is known by its title.
struct Peer
{
    QVector<QByteArray> addresses;  ///< numeric, from which it may call; empty: from any
    QByteArray host;                ///< where it is called, a name or an address; empty: it never is
    quint16 port = 0;               ///< likewise
    bool isSecure = false;          ///< it is called over TLS
    Rights rights;
    std::shared_ptr<const Kxg::StudyLimits> studies = nullptr;  ///< that it may see; null: all
};

/// Which associations are accepted, and for what.
struct AssociationRules
{
    QVector<QByteArray> titles;       ///< under which the server is called; empty: under any
    QHash<QByteArray, Peer> peers;    ///< by title
    Rights anyone;                    ///< of those who are none of the peers; without any they are rejected
    bool takesUnknownClasses = true;  ///< objects of SOP classes that no table knows

    /// Everybody may do everything.
    static AssociationRules open();

    bool isCalledBy(const QByteArray& title) const { return titles.isEmpty() || titles.contains(title); }

    /// Null when it is not known.
    const Peer* find(const QByteArray& title) const;

    /// Of who calls under that title from that numeric address. None: the association is rejected.
    Rights rightsOf(const QByteArray& title, const QByteArray& address) const;

    /// That who has that title may see; null: all.
    std::shared_ptr<const Kxg::StudyLimits> studiesOf(const QByteArray& title) const;
};

/// Who asked for an association.
struct Caller
{
    QByteArray title;        ///< as it says
    QByteArray address;      ///< numeric
    QByteArray certificate;  ///< whom the certificate names that it showed; empty when it showed none
    Rights rights;
    std::shared_ptr<const Kxg::StudyLimits> studies;  ///< that it may see; null: all
};

}  // namespace Kdd::Dimse
