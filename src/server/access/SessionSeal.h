#pragma once

#include <QByteArray>
#include <QString>
#include <QVector>

#include <kddlib/Result.h>

namespace Kdd::Access
{

/// Seals what a browser keeps for us, so that it can neither read nor change it: every server that has the keys knows its
/// sessions without having to ask another. May be used on any thread.
class SessionSeal
{
public:
    /// What a sealed text is for. One cannot be taken for the other.
    enum class Purpose { Session, SigningIn };

    /// Keys of 32 bytes, in hexadecimal digits, one a line; "#" begins a remark. The first one seals, by all is opened: a new
    /// key is put in front, and the old one goes when what it sealed has expired.
    static Result read(const QString& path, SessionSeal& seal);
    static Result parse(const QByteArray& text, SessionSeal& seal);

    /// In letters that may stand in a cookie; null when there is no key or the text is longer than a cookie may be.
    QByteArray seal(Purpose purpose, const QByteArray& text) const;

    /// False, with `text` as it was, when none of the keys sealed it, for that purpose and in this form.
    bool open(Purpose purpose, const QByteArray& sealed, QByteArray& text) const;

private:
    QVector<QByteArray> mKeys;
};

}  // namespace Kdd::Access
