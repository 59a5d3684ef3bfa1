#pragma once

#include "platform/database/DatabaseAddress.h"

#include <QString>
#include <QStringList>

namespace Kxg
{

/// All that the two engines want said differently; every other statement is the same for both.
struct SqlDialect
{
    QString driver;  ///< of Qt
    QString
        connectOptions;  ///< in the driver's form; of a server with the time in which it is to be reached [s] as %1
    QStringList afterOpening;  ///< statements that every connection begins with
    QStringList beforeSchema;  ///< statements that a new database needs once, outside a transaction

    /// What a transaction begins with: for reading, one state of the database throughout; for writing, the only writer.
    QStringList beginReading;
    QStringList beginWriting;

    QString tellOfWork;  ///< a statement that wakes those who wait for work; empty: there is none

    QString hasSchema;  ///< a question that gives one number, not 0 when there is a table "schema_version"

    // column types, named {id}, {key}, {text} and {bytes} in the schema
    QString id;     ///< a key that the engine numbers, never using a number twice
    QString key;    ///< a key that somebody else has numbered
    QString text;   ///< UTF-8, in the order of its bytes
    QString bytes;  ///< likewise

    QString alsoInIndex;  ///< between what an index is ordered by and what it only has

    QString bytesOf;  ///< the bytes of a text, which stands in place of %1
    QString holds;    ///< whether bytes are among those of the column %1

    // a list of numbers of any length as one value: the condition, and the value with the numbers in place of %1
    QString isOneOf;
    QString list;

    // texts of studies, which are searched for parts
    QString wordsOf;  ///< whether the column %1 matches a pattern

    /// A pattern of `*` and of what stands for itself, as the engine writes it.
    QByteArray pattern(const QByteArray& stars) const;

    bool isRemote = false;       ///< each statement is a message to a server, and another one back
    bool hasMatchIndex = false;  ///< parts are found by a table of its own, and not by the engine's choice

    static const SqlDialect& of(DatabaseAddress::Engine engine);
};

/// The numbered locks that we take on a PostgreSQL server, beside a number: a study's id, or this one for writing.
constexpr int kAdvisoryLocks = 0x4b444442;
constexpr int kWriterLock = -1;

/// The channel on which such a server tells of work.
constexpr char kWorkChannel[] = "kdd_work";

}  // namespace Kxg
