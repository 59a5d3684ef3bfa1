#pragma once

#include "server/dicomweb/StudyShelf.h"
#include "server/http/Response.h"

#include <QVector>

#include <kddlib/QAAudit.h>

namespace Kdd::DicomWeb
{

/// What the audit logs of a study's images tell, image by image in the order of their UIDs, the oldest correction first.
///
///     {"study": "1.2", "corrections": [
///       {"image": "1.2.3.1", "series": "1.2.3", "time": "2024-01-31T12:00:00", "who": "anna",
///        "changes": [{"tag": "00100010", "keyword": "PatientName", "old": "A", "new": "B"}]}],
///      "unreadable": ["1.2.3.2"]}
///
/// "unreadable" names images whose log is damaged. As CSV each change is a record of its own, with the same names; see
/// `csvField` for how values stand there, and damaged logs have a record without time whose keyword says so.
class CorrectionHistory : public Http::Producer
{
public:
    enum class Form { Json, Csv };

    CorrectionHistory(std::shared_ptr<const ServedStudy> study, const QByteArray& studyUID, Form form)
        : mStudy(std::move(study))
        , mStudyUID(studyUID)
        , mForm(form)
    {
    }

    Result next(QByteArray& block) override;

private:
    void addImages(const TagFile& file, QByteArray& block);
    void addImage(const QByteArray& key, const TagMap& image, QByteArray& block);
    void addJson(const QByteArray& image, const QByteArray& series, const AuditEntry& entry,
                 QByteArray& block);
    void addCsv(const QByteArray& image, const QByteArray& series, const AuditEntry& entry,
                QByteArray& block) const;

    std::shared_ptr<const ServedStudy> mStudy;
    QByteArray mStudyUID;
    Form mForm;
    QByteArray mLast;  // image that was told of
    QVector<QByteArray> mUnreadable;
    bool mHasBegun = false;
    bool mHasImages = true;  // that were not told of
    bool mHasEnded = false;
    bool mIsFirst = true;  // correction
};

/// When a correction was made, and by whom, as an audit log has it in one line. ("2024-01-31T12:00:00", "anna"); a line that is
/// none stays whole.
struct CorrectionTime
{
    QString moment;
    QString who;

    static CorrectionTime of(const QString& logged);
};

/// A field of a CSV record (RFC 4180), always in quotes. Spreadsheets take texts that begin with some characters for formulas:
/// before these there is an apostrophe, and before an apostrophe as well, so that the value can be had again.
QByteArray csvField(const QString& value);

}  // namespace Kdd::DicomWeb
