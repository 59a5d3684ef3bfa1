#pragma once

#include "sample/Patient.h"

#include <QString>

namespace Kdd
{

class SampleDataset;

/// One study: whose it is, what it is about, when it began and how much of it there is.
struct SampleStudy
{
    unsigned seed = 1;
    QString directory;  // "CT-1"; also what everything random in the study is named after
    SamplePatient patient;
    const char* description = "";
    int images = 0;       // files to write
    int startSecond = 0;  // [s] after midnight

    /// A name that nothing else has, in this study or another one.
    QByteArray name(const QByteArray& part) const;
    QByteArray uid(const QByteArray& part) const;

    /// The time of day, `second` after the study began.
    QByteArray time(double second) const;

    QByteArray accessionNumber() const;

    /// Adds what all objects of the study share, the patient included.
    void describe(SampleDataset& dataset) const;

    /// Adds the request that led to the study, with the codes of its protocol.
    void describeRequest(SampleDataset& dataset) const;

    /// Adds what was corrected after the patient arrived without papers: the earlier name has, inside its
    /// sequence item, another character set than the object around it.
    void describeCorrection(SampleDataset& dataset) const;
};

/// The day of all the studies.
extern const char* const kSampleDate;

}  // namespace Kdd
