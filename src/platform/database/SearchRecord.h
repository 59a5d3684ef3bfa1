#pragma once

#include "platform/database/TagFileStamp.h"

#include <QByteArray>
#include <QPair>
#include <QVector>

#include <vector>

namespace Kxg
{

// What searches know of a study. Texts are UTF-8. Dates are YYYYMMDD and times HHMMSS.FFFFFF, or empty; so they are in
// the order of their bytes.
//
// `attributes` is what an answer may show of the level: a line for each attribute, by tag, of its eight hexadecimal digits
// and its element in the DICOM JSON model ("00100020{"vr":"LO","Value":["7"]}").

struct SeriesSearchRecord
{
    QByteArray uid;
    QByteArray modality;
    QByteArray number;
    QByteArray description;
    QByteArray performedDate;  ///< of the performed procedure step's start
    QByteArray performedTime;
    QVector<QPair<QByteArray, QByteArray>> requests;  ///< scheduled procedure step and requested procedure
    int instances = 0;
    QByteArray attributes;
};

struct StudySearchRecord
{
    QByteArray date;
    QByteArray time;
    QByteArray accessionNumber;
    QByteArray referringPhysician;
    QByteArray patientName;
    QByteArray patientID;
    QByteArray patientBirthDate;
    QByteArray patientSex;
    QByteArray studyID;
    QByteArray description;
    QByteArray attributes;
    std::vector<SeriesSearchRecord> series;
};

}  // namespace Kxg
