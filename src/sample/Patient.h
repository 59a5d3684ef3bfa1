#pragma once

#include "sample/Charset.h"

namespace Kdd
{

class SampleDataset;

/// A patient, with all texts in the bytes of the patient's character set.
struct SamplePatient
{
    SampleCharset charset = SampleCharset::Ascii;
    QByteArray name;
    QByteArray sex;
    QByteArray id;
    QByteArray birthDate;
    QByteArray age;
    QByteArray size;    // [m]
    QByteArray weight;  // [kg]
    QByteArray address;
    QByteArray comments;
    QByteArray physician;  // who sent the patient

    void describe(SampleDataset& dataset) const;
};

/// The patient of set `set`, counted from 1, whose texts are written in `charset`.
SamplePatient samplePatient(unsigned seed, int set, SampleCharset charset);

}  // namespace Kdd
