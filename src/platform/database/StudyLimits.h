#pragma once

#include <QByteArray>
#include <QVector>

#include <vector>

namespace Kxg
{

/// One thing that is asked of a study.
struct StudyLimit
{
    enum class Of {
        Uid,    ///< the study has one of the UIDs
        Study,  ///< it has one of the elements
        Series,  ///< one of its series has one of the elements, and no series has another value of the attribute
    };

    Of of = Of::Uid;
    QByteArray attribute;        ///< eight hexadecimal digits
    QVector<QByteArray> values;  ///< UIDs, or lines as in StudySearchRecord ("00080080{...}"); none: no study
};

/// The studies that somebody may see: those of which all hold.
struct StudyLimits
{
    std::vector<StudyLimit> all;
};

}  // namespace Kxg
