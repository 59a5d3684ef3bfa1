#pragma once

#include <QStringList>

#include <kddlib/StudyLimits.h>

namespace Kdd::DicomWeb
{

/// An attribute by whose values studies can be kept from those who are not to see them: one that searches hold of a study or
/// of series, is a text, and has one value.
struct StudyRule
{
    Kxg::StudyLimit::Of of = Kxg::StudyLimit::Of::Uid;
    QByteArray attribute;  ///< eight hexadecimal digits
    QByteArray vr;

    /// By keyword or digits. False when there is no such attribute, or it is not of that kind.
    static bool resolve(const QByteArray& name, StudyRule& rule);

    /// One of these values is asked for, letter by letter; of person names with all their groups.
    Kxg::StudyLimit limit(const QStringList& values) const;
};

}  // namespace Kdd::DicomWeb
