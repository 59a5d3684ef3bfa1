#pragma once

#include "kddlib/tagfile/qa/QAAudit.h"
#include "kddlib/tagfile/qa/QAData.h"
#include "kddlib/tagmodel/VrCode.h"
#include "platform/base/Result.h"

namespace Kdd
{

class TagElement;
class TagMap;

/// "(gggg,eeee)"
QString keyName(const DcmTagKey& key);

/// Whether the text can stand in a line of an audit log as it is.
bool isOneLine(const QString& text);

/// A job's timestamp, or the present moment when it is blank, as audit logs tell it: "31/1/2024 12:00:00 PM". False when
/// it is no time of the form "yyyyMMddhhmmss", which a fraction of the second and a time zone may follow.
bool auditTime(const QByteArray& timestamp, QString& time);

/// Whether anything speaks against the job, so that it can be applied to no image at all.
Result check(const QAData& job);

/// Replaces values of one image and notes what it has changed. The image must outlive the editor.
class QAEditor
{
public:
    /// Texts are written in the character set that the image has when the whole job is done.
    QAEditor(TagMap& image, const QVector<QASubstitution>& job);

    /// Gives the image the value, unless it has it already. Fails, with the image as it was, when it cannot be done
    /// without losing something.
    Result substitute(const QASubstitution& substitution);

    const QVector<AuditChange>& changes() const { return mChanges; }
    bool hasChanged(const DcmTagKey& key) const;

private:
    Result check(const DcmTagKey& key, const TagElement* shown) const;
    VrCode vrFor(const DcmTagKey& key, const TagElement* shown) const;
    Result encode(const QString& text, VrCode vr, TagElement& element) const;
    QString decode(const DcmTagKey& key, const QByteArray& characterSet) const;

    TagMap& mImage;
    QByteArray mOldCharacterSet;
    QByteArray mNewCharacterSet;
    QVector<AuditChange> mChanges;
};

}  // namespace Kdd
