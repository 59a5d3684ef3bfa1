#pragma once

#include "server/dicomweb/StudyShelf.h"
#include "server/dicomweb/retrieve/ImageFinder.h"
#include "server/dicomweb/retrieve/ObjectShelf.h"
#include "server/dicomweb/search/StudySight.h"
#include "server/dimse/FindSearch.h"
#include "server/dimse/QueryEnding.h"
#include "server/dimse/QueryIdentifier.h"

#include <vector>

class DcmItem;

namespace Kdd::Dimse
{

/// What retrieval stands on. All of it outlives those who have it.
struct RetrieveSource
{
    const DicomWeb::ThreadSearch& database;
    DicomWeb::StudyShelf& studies;
    DicomWeb::ObjectShelf& objects;
    const DicomWeb::StudySight& sight;
};

/// What is to be retrieved: the unique keys of an identifier. Whatever else it says is passed over.
struct RetrieveIdentifier
{
    QueryLevel level = QueryLevel::Study;
    QString patientID;            ///< whose the objects have to be; empty: of anybody
    QVector<QByteArray> studies;  ///< one of each of these; empty: of any
    QVector<QByteArray> series;
    QVector<QByteArray> images;

    /// False, with the reason, when it cannot be understood, or names nothing on its own level: nobody wants it all.
    static bool read(DcmItem& dataset, QueryRoot root, RetrieveIdentifier& identifier, QString& reason);
};

/// An object that is to be sent.
struct RetrieveItem
{
    QByteArray study;
    DicomWeb::ListedImage image;
    QByteArray sopClass;
    QByteArray storedSyntax;  ///< as far as the tag file knows; empty when it does not
};

/// Puts all that the identifier names and that is within the limits into `items`, as the tag files show it now, study by
/// study.
QueryEnding listItems(const RetrieveIdentifier& identifier, const StudyLimits& limits,
                      const RetrieveSource& source, std::vector<RetrieveItem>& items);

}  // namespace Kdd::Dimse
