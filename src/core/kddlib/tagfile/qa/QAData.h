#pragma once

#include "kddlib/tagfile/ChangeFault.h"
#include "kddlib/tagfile/qa/QAAudit.h"
#include "platform/base/Export.h"

#include <QByteArray>
#include <QList>
#include <QString>
#include <QVector>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctagkey.h>

namespace Kdd
{

/// An attribute and the text it gets. A null text is no value, an empty one an empty value. Of Pixel Data nothing is
/// replaced; the text is a remark for the audit log.
struct QASubstitution
{
    DcmTagKey key;
    QString value;
};

/// What a correction changed of one image.
struct QAImageOutcome
{
    QByteArray image;              ///< under which it was known before
    QVector<AuditChange> changes;  ///< in the order of the job
};

/// A correction of stored images, to be applied by `TagFile::applyQA`: an edit of a study, or with an old study a move
/// of images from there into the study.
///
/// A value. Each thread uses a copy of its own.
struct KDD_EXPORT QAData
{
    QByteArray studyUID;
    QByteArray oldStudyUID;  ///< empty for an edit
    QVector<QASubstitution> substitutions;
    QByteArray timestamp;            ///< "yyyyMMddhhmmss" as the job has it, or blank for now
    QByteArray login;                ///< who corrects, one line of Latin-1; may be empty
    QList<QByteArray> images;        ///< SOP Instance UIDs
    QList<QByteArray> series;        ///< Series Instance UIDs, all images of which are meant too
    bool isOfWholeStudy = false;     ///< all images of the study, of a move of the old one, are meant
    QList<QByteArray> cacheEntries;  ///< names of file-cache entries, for the caller's use

    /// What `applyQA` did, or would do.
    struct Outcome
    {
        int asked = 0;               ///< images that the job means
        int changed = 0;             ///< images with a new entry in their audit log
        int moved = 0;               ///< images that are now in another study, series or under another UID
        QList<QByteArray> notFound;  ///< images and series that no study concerned holds
        QVector<QAImageOutcome> images;  ///< those that are changed
        ChangeFault fault = ChangeFault::None;
        QByteArray refusedImage;  ///< the image that the reason names; empty: none
    };

    Outcome outcome;

    /// Takes old study, substitutions, timestamp and login from the XML of a job:
    ///
    ///     <Job>
    ///       <Timestamp>20240131120000</Timestamp> <Login>anna</Login>
    ///       <Substitutions OldSUID="1.2.3">
    ///         <Tag Group="0010" Element="0010"><Value>Doe^Jane</Value></Tag>
    ///       </Substitutions>
    ///     </Job>
    ///
    /// Elements count by their names, wherever they stand; others are passed over. A timestamp may have white space
    /// around it and a fraction of the second, and is kept with them; a login loses the white space around it. False,
    /// with the job as it was and the line and the reason in `message`, for XML that is damaged, larger than
    /// `kMaxJobXml` or has a document type, for a number, timestamp or login that is none, for a Tag without Value (but
    /// for Pixel Data) or that stands twice.
    ///
    /// Bytes are in the encoding that the XML declares, else in UTF-8. Of a text the declaration counts for nothing.
    bool parse(const QByteArray& xml, QString& message);
    bool parseText(const QString& xml, QString& message);

private:
    template <typename Xml>
    bool take(const Xml& xml, QString& message);
};

}  // namespace Kdd
