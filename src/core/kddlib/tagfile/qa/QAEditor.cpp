#include "kddlib/tagfile/qa/QAEditor.h"

#include "kddlib/items/TextDecoding.h"
#include "kddlib/items/TextEncoding.h"
#include "kddlib/tagfile/qa/QAValues.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/Tokenizer.h"

#include <QDateTime>
#include <QLocale>
#include <QRegularExpression>

#include <dcmtk/dcmdata/dcdeftag.h>

#include <algorithm>
#include <cmath>
#include <limits>

namespace Kdd
{

namespace
{

// As DICOM allows [characters].
constexpr int kLongestUid = 64;
constexpr quint16 kOurPublicGroup = 0x0006;

/// What an image is known and found by.
bool isIdentity(const DcmTagKey& key)
{
    return key == DCM_StudyInstanceUID || key == DCM_SeriesInstanceUID || key == DCM_SOPInstanceUID;
}

/// Liberal, because studies with odd UIDs exist and are what corrections are for.
bool isUid(const QString& text)
{
    return !text.isEmpty() && text.size() <= kLongestUid &&
           std::all_of(text.begin(), text.end(), [](QChar c) {
               return c.unicode() > 0x20 && c.unicode() < 0x7f && c != QLatin1Char('\\');
           });
}

bool isPrivate(const DcmTagKey& key)
{
    return (key.getGroup() & 1) != 0;
}

/// The values are texts in the image's own character sets; those of all other text VRs are ASCII.
bool takesCharacterSet(VrCode vr)
{
    switch (vr) {
    case VrCode::LO:
    case VrCode::LT:
    case VrCode::PN:
    case VrCode::SH:
    case VrCode::ST:
    case VrCode::UT:
        return true;
    default:
        return false;
    }
}

struct IntegerRange
{
    qint64 least;
    qint64 greatest;
};

template <typename T>
IntegerRange rangeOf()
{
    return {std::numeric_limits<T>::min(), std::numeric_limits<T>::max()};
}

bool isInteger(const QByteArray& word, const IntegerRange& range)
{
    bool isNumber = false;
    const qint64 value = word.toLongLong(&isNumber);
    return isNumber && value >= range.least && value <= range.greatest;
}

bool isReal(const QByteArray& word, double greatest)
{
    bool isNumber = false;
    const double value = word.toDouble(&isNumber);
    return isNumber && std::abs(value) <= greatest;
}

/// Whether a binary VR holds the number that the word stands for.
bool isNumberOf(VrCode vr, const QByteArray& word)
{
    switch (vr) {
    case VrCode::FL:
    case VrCode::OF:
        return isReal(word, static_cast<double>(std::numeric_limits<float>::max()));
    case VrCode::FD:
        return isReal(word, std::numeric_limits<double>::max());
    case VrCode::SL:
        return isInteger(word, rangeOf<qint32>());
    case VrCode::SS:
        return isInteger(word, rangeOf<qint16>());
    case VrCode::UL:
        return isInteger(word, rangeOf<quint32>());
    default:
        return isInteger(word, rangeOf<quint16>());
    }
}

/// The first of the words that is no number of the VR; empty when all are.
QByteArray firstMisfit(VrCode vr, const QByteArray& text)
{
    QByteArray word;
    for (Tokenizer words(text); words.next(word);) {
        if (!isNumberOf(vr, word))
            return word;
    }
    return {};
}

/// The dictionary's, as a new element would get it.
VrCode dictionaryVr(const DcmTagKey& key, const char* creator)
{
    TagMap probe;
    probe.putAndInsertString(key, creator, QByteArray());
    return probe.findElement(key)->vr();
}

/// The first character that the set lacks.
QString firstUnwritable(const QString& text, const QByteArray& characterSet)
{
    QByteArray unused;
    for (int i = 0; i < text.size(); ++i) {
        // A character beyond 16 bits is two places of the text.
        const int length = text.at(i).isHighSurrogate() ? 2 : 1;
        QString character = text.mid(i, length);
        if (!encodeText(character, characterSet, unused))
            return character;
        i += length - 1;
    }
    return text;
}

}  // namespace

QString keyName(const DcmTagKey& key)
{
    return QString::fromStdString(key.toString());
}

bool isOneLine(const QString& text)
{
    return std::all_of(text.begin(), text.end(), [](QChar c) { return c.isPrint(); });
}

/// Without a time zone: what a scanner of another zone calls half past two may be skipped by the clocks here. White space
/// around the timestamp, fractions of the second and the zone, which all are left out, come from writers that take it
/// for any DICOM time.
bool auditTime(const QByteArray& timestamp, QString& time)
{
    static const QRegularExpression form(QStringLiteral("^(\\d{8})(\\d{6})(\\.\\d*)?([+-]\\d{4})?$"));
    QDateTime moment = QDateTime::currentDateTime();
    const QString text = QString::fromLatin1(timestamp.trimmed());
    if (!text.isEmpty()) {
        const QRegularExpressionMatch parts = form.match(text);
        moment = QDateTime(QDate::fromString(parts.captured(1), QStringLiteral("yyyyMMdd")),
                           QTime::fromString(parts.captured(2), QStringLiteral("hhmmss")), Qt::UTC);
        if (!moment.isValid())
            return false;
    }
    time = QLocale::c().toString(moment, QStringLiteral("d/M/yyyy h:mm:ss A"));
    return true;
}

Result check(const QAData& job)
{
    QString unused;
    if (job.studyUID.isEmpty())
        return Result::failure(QStringLiteral("The job names no study"));
    if (!auditTime(job.timestamp, unused))
        return Result::failure(QStringLiteral("Timestamp \"%1\" is no time of the form yyyyMMddhhmmss")
                                   .arg(QString::fromLatin1(job.timestamp)));
    if (!isOneLine(QString::fromLatin1(job.login)))
        return Result::failure(QStringLiteral("The login is not one line of text"));
    for (const QASubstitution& each : job.substitutions) {
        const DcmTagKey& key = each.key;
        if (each.value.isNull() && key != DCM_PixelData)
            return Result::failure(QStringLiteral("Tag %1 has no value").arg(keyName(key)));
        if (isIdentity(key) && !isUid(each.value))
            return Result::failure(QStringLiteral("Tag %1: \"%2\" is no UID").arg(keyName(key), each.value));
        if (key == DCM_StudyInstanceUID && each.value != QString::fromLatin1(job.studyUID))
            return Result::failure(QStringLiteral("Tag %1 asks for study %2, but the job is one of study %3")
                                       .arg(keyName(key), each.value, QString::fromLatin1(job.studyUID)));
        // Group 0 belongs to messages and group 2 to the head of
        // the file; element 0 is the length of a group.
        if (key.getGroup() == kOurPublicGroup || key.getGroup() <= 2 || key.getElement() == 0)
            return Result::failure(QStringLiteral("Tag %1 is no attribute of an image").arg(keyName(key)));
        if (isPrivate(key) && key.getElement() <= 0xff)
            return Result::failure(
                QStringLiteral("Tag %1 reserves a private block, which gives others their meaning")
                    .arg(keyName(key)));
    }
    return {};
}

QAEditor::QAEditor(TagMap& image, const QVector<QASubstitution>& job)
    : mImage(image)
{
    image.findAndGetString(DCM_SpecificCharacterSet, mOldCharacterSet);
    mNewCharacterSet = mOldCharacterSet;
    for (const QASubstitution& each : job) {
        // All texts of the job go by it, wherever in the job it stands.
        if (each.key == DCM_SpecificCharacterSet)
            mNewCharacterSet = each.value.toLatin1();
    }
}

bool QAEditor::hasChanged(const DcmTagKey& key) const
{
    return std::any_of(mChanges.begin(), mChanges.end(),
                       [&](const AuditChange& change) { return change.key == key; });
}

Result QAEditor::substitute(const QASubstitution& substitution)
{
    const DcmTagKey& key = substitution.key;
    if (key == DCM_PixelData) {
        mChanges.append({key, QString(), substitution.value});
        return {};
    }
    const TagElement* shown = mImage.findElement(key);
    Result result = check(key, shown);
    TagElement element(vrFor(key, shown), QByteArray());
    if (result.good())
        result = encode(substitution.value, element.vr(), element);
    if (result.bad())
        return result.within(QStringLiteral("Tag %1").arg(keyName(key)));
    // Numbers are equal when their bytes are, texts when they say the same: what has no element says nothing.
    const bool isEqual = isTextVr(element.vr()) ? decode(key, mNewCharacterSet) == substitution.value
                         : shown != nullptr     ? shown->value() == element.value()
                                                : element.value().isEmpty();
    if (isEqual)
        return {};
    // Only now: a value that is there already is not judged, so that a job that was done can be run again.
    const QByteArray odd = firstOddValue(element.vr(), element.value());
    if (!odd.isEmpty())
        return Result::failure(QStringLiteral("Tag %1: \"%2\" is no %3 of VR %4")
                                   .arg(keyName(key), QString::fromLatin1(odd),
                                        QLatin1String(kindOfValue(element.vr())),
                                        QLatin1String(vrName(element.vr()))));
    mChanges.append({key, decode(key, mOldCharacterSet), substitution.value});
    mImage.putAndInsertValue(key, element.vr(), element.value());
    return {};
}

Result QAEditor::check(const DcmTagKey& key, const TagElement* shown) const
{
    if (shown != nullptr && shown->markedAsOmitted())
        return Result::failure(
            QStringLiteral("the present value is too long to be kept, so it could not be told what it was"));
    const char* creator = mImage.privateCreator(key);
    if (creator != nullptr && qstrcmp(creator, kOurPrivateCreator) == 0)
        return Result::failure(QStringLiteral("it is no attribute of an image"));
    return {};
}

/// That of the value that is replaced, unless a writer stored it without one.
VrCode QAEditor::vrFor(const DcmTagKey& key, const TagElement* shown) const
{
    const bool isKnown = shown != nullptr && !shown->markedAsOmitted() && shown->vr() != VrCode::UN;
    return isKnown ? shown->vr() : dictionaryVr(key, mImage.privateCreator(key));
}

/// Puts the text into the element. Fails when that would not keep all of it.
Result QAEditor::encode(const QString& text, VrCode vr, TagElement& element) const
{
    const QByteArray characterSet = takesCharacterSet(vr) ? mNewCharacterSet : QByteArray();
    QByteArray bytes = text.toLatin1();
    const bool isAscii = std::all_of(text.begin(), text.end(), [](QChar c) { return c.unicode() < 0x80; });
    if (!takesCharacterSet(vr) && !isAscii)
        return Result::failure(QStringLiteral("\"%1\" has other characters than its VR %2 may have")
                                   .arg(text, QLatin1String(vrName(vr))));
    if (!encodeText(text, characterSet, bytes)) {
        const QString character = firstUnwritable(text, characterSet);
        return Result::failure(
            QStringLiteral("\"%1\" (U+%2) cannot be written in the image's character set \"%3\"")
                .arg(character)
                .arg(character.toUcs4().value(0), 4, 16, QLatin1Char('0'))
                .arg(QString::fromLatin1(characterSet)));
    }
    if (!element.putValueAsString(bytes))
        return Result::failure(
            QStringLiteral("a value of VR %1 cannot be replaced by a text").arg(QLatin1String(vrName(vr))));
    const QByteArray misfit = isTextVr(vr) ? QByteArray() : firstMisfit(vr, bytes);
    if (!misfit.isEmpty())
        return Result::failure(QStringLiteral("\"%1\" is no number of VR %2")
                                   .arg(QString::fromLatin1(misfit), QLatin1String(vrName(vr))));
    return {};
}

/// What the image shows as text; empty when it shows nothing.
QString QAEditor::decode(const DcmTagKey& key, const QByteArray& characterSet) const
{
    QByteArray bytes;
    mImage.findAndGetString(key, bytes);
    return decodeText(bytes, characterSet);
}

}  // namespace Kdd
