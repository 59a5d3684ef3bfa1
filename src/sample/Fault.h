#pragma once

#include <QString>

#include <stdexcept>

namespace Kdd
{

/// Ends the making of sample studies: a sentence for the user that says what could not be done and why.
class SampleFault : public std::runtime_error
{
public:
    explicit SampleFault(const QString& sentence)
        : std::runtime_error(sentence.toStdString())
    {
    }

    QString sentence() const { return QString::fromUtf8(what()); }
};

}  // namespace Kdd
