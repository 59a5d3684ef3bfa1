#pragma once

#include "kddlib/tagfile/format/FileSizes.h"
#include "platform/base/Result.h"

#include <QString>

class QDataStream;

namespace Kdd
{

class StudyTree;

struct StudyRequest
{
    QString name;          ///< of the file, for messages; may be empty
    const char* studyUID;  ///< null for the first study found
};

/// Reads a tag file into the tree, which must be empty, and stays or becomes so on failure. Faults of the file are
/// logged; that it holds no study, or not the one asked for, is none.
Result readStudy(QDataStream& in, const StudyRequest& request, StudyTree& tree, FileSizes& sizes);

}  // namespace Kdd
