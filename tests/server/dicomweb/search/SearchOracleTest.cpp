#include "SearchedArchive.h"
#include "support/RealFiles.h"

#include <QFileInfo>
#include <QRegularExpression>

#include <kddlib/OwnAttributes.h>
#include <kddlib/TagMap.h>
#include <kddlib/TextDecoding.h>

#include <random>

using namespace Kdd;
using namespace Kdd::DicomWeb;

namespace
{

/// Answers the same questions by walking over datasets, with rules written down a second time.
class Oracle
{
public:
    /// Files in the order of their paths: the first of a study describes it.
    void add(const QString& path)
    {
        DcmFileFormat file;
        if (file.loadFile(path.toLocal8Bit().constData()).bad())
            return;
        const QString study = text(*file.getDataset(), DCM_StudyInstanceUID);
        const QString image = text(*file.getDataset(), DCM_SOPInstanceUID);
        if (study.isEmpty() || image.isEmpty() || text(*file.getDataset(), DCM_SeriesInstanceUID).isEmpty())
            return;
        if (!mFirst.contains(study)) {
            for (const DcmTagKey& key : kKeys)
                mFirst[study][key] = text(*file.getDataset(), key);
        }
        mModalities[study].insert(text(*file.getDataset(), DCM_Modality));
    }

    QStringList find(const DcmTagKey& key, const QString& query) const
    {
        QStringList found;
        for (auto study = mFirst.begin(); study != mFirst.end(); ++study) {
            if (key == DCM_ModalitiesInStudy ? mModalities.value(study.key()).contains(query)
                                             : matches(key, study.value().value(key), query))
                found << study.key();
        }
        found.sort();
        return found;
    }

    QString valueOf(int study, const DcmTagKey& key) const
    {
        const auto at = mFirst.begin() + study % mFirst.size();
        return key == DCM_ModalitiesInStudy ? *mModalities.value(at.key()).begin() : at.value().value(key);
    }

    int size() const { return mFirst.size(); }

    static const std::vector<DcmTagKey> kKeys;

private:
    static QString text(DcmItem& item, const DcmTagKey& key)
    {
        OFString value;
        OFString characterSet;
        item.findAndGetOFStringArray(DCM_SpecificCharacterSet, characterSet);
        item.findAndGetOFStringArray(key, value);
        return decodeText(QByteArray(value.c_str()), QByteArray(characterSet.c_str())).trimmed();
    }

    static QString folded(const QString& text)
    {
        QString plain = text.normalized(QString::NormalizationForm_KD);
        plain.remove(
            QRegularExpression(QStringLiteral("\\p{Mn}"), QRegularExpression::UseUnicodePropertiesOption));
        return plain.toCaseFolded().normalized(QString::NormalizationForm_C).trimmed();
    }

    static QString expression(const QString& wildcards, const char* any)
    {
        QString made;
        for (const QChar each : wildcards)
            made += each == QLatin1Char('*')   ? QLatin1String(any) + QLatin1Char('*')
                    : each == QLatin1Char('?') ? QString(QLatin1Char('.'))
                                               : QRegularExpression::escape(QString(each));
        return made;
    }

    static bool fits(const QString& text, const QString& expression)
    {
        return QRegularExpression(QLatin1String("^(?:") + expression + QLatin1String(")$"),
                                  QRegularExpression::DotMatchesEverythingOption)
            .match(text)
            .hasMatch();
    }

    static bool matchesName(const QString& name, const QString& query)
    {
        if (query.contains(QLatin1Char('='))) {
            const QStringList wanted = query.split(QLatin1Char('='));
            const QStringList groups = name.split(QLatin1Char('='));
            for (int i = 0; i < wanted.size(); ++i) {
                if (!wanted.at(i).isEmpty() && !matchesName(groups.value(i), wanted.at(i)))
                    return false;
            }
            return true;
        }
        QString parts;
        if (query.contains(QLatin1Char('^'))) {
            QStringList components;
            for (const QString& each : query.split(QLatin1Char('^')))
                components << (each.isEmpty() ? QStringLiteral("[^^]*") : expression(folded(each), "[^^]"));
            parts = components.join(QStringLiteral("\\^"));
        } else {
            parts = expression(folded(query), ".");
        }
        for (const QString& group : name.split(QLatin1Char('='))) {
            QStringList components;
            for (const QString& each : group.split(QLatin1Char('^')))
                components << folded(each);
            while (query.contains(QLatin1Char('^')) && components.size() < 5)
                components << QString();
            if (!group.trimmed().isEmpty() &&
                fits(components.join(QLatin1Char('^')), parts + QLatin1String("(\\^.*)?")))
                return true;
        }
        return false;
    }

    static bool matches(const DcmTagKey& key, const QString& value, const QString& query)
    {
        if (query.isEmpty() || query == QLatin1String("*"))
            return true;
        if (value.isEmpty())
            return false;
        const DcmEVR vr = DcmTag(key).getEVR();
        if (vr == EVR_PN)
            return matchesName(value, query);
        if (vr == EVR_DA) {
            const int dash = query.indexOf(QLatin1Char('-'));
            QString day = value;
            day.remove(QLatin1Char('.'));
            if (day.size() != 8)
                return false;
            return dash < 0
                       ? day == query
                       : day >= query.left(dash) && (dash == query.size() - 1 || day <= query.mid(dash + 1));
        }
        if (query.contains(QLatin1Char('*')) || query.contains(QLatin1Char('?')))
            return fits(folded(value), expression(folded(query), "."));
        return value == query;
    }

    QMap<QString, QMap<DcmTagKey, QString>> mFirst;
    QMap<QString, QSet<QString>> mModalities;
};

const std::vector<DcmTagKey> Oracle::kKeys = {
    DCM_PatientName,      DCM_PatientID, DCM_StudyDate,        DCM_AccessionNumber,
    DCM_StudyDescription, DCM_StudyID,   DCM_PatientBirthDate, DCM_ReferringPhysicianName};

class SearchOracle : public SearchedArchive
{
};

INSTANTIATE_TEST_SUITE_P(Engines, SearchOracle, kBothEngines, engineName);

/// A value of the archive, or a piece of one with wildcards.
QString question(const QString& value, bool isDate, std::mt19937& random)
{
    if (isDate) {
        const QString day = value.isEmpty() ? QStringLiteral("20000101") : value;
        const QString forms[] = {day, day + QLatin1Char('-'), QLatin1Char('-') + day,
                                 QStringLiteral("19900101-") + day};
        return forms[random() % 4];
    }
    QString text = value;
    if (value.isEmpty() || text.contains(QLatin1Char('\\')) || random() % 4 == 0)
        return text;
    const int from = static_cast<int>(random() % static_cast<unsigned>(text.size()));
    const int length = 1 + static_cast<int>(random() % static_cast<unsigned>(text.size() - from));
    const QString piece = text.mid(from, length);
    if (piece.contains(QLatin1Char('=')))
        return text;
    switch (random() % 5) {
    case 0:
        return QLatin1Char('*') + piece + QLatin1Char('*');
    case 1:
        return piece + QLatin1Char('*');
    case 2:
        return QLatin1Char('*') + piece.toUpper();
    case 3:
        return QLatin1Char('*') + piece.left(length / 2) + QLatin1Char('?') + piece.mid(length / 2 + 1) +
               QLatin1Char('*');
    default:
        return piece;
    }
}

TEST_P(SearchOracle, AgreesOnRandomQuestionsOverRealFiles)
{
    if (realFilesFolder().isEmpty())
        GTEST_SKIP() << "KDD_TEST_DATA is not set";
    Oracle oracle;
    QStringList taken;
    for (const char* folder : {"charsets", "modalities", "odd/ids", "series/geometry"})
        taken << realFiles(folder);
    taken.sort();
    for (const QString& file : qAsConst(taken)) {
        const QString copy =
            path("images") + QLatin1Char('/') +
            QFileInfo(file).path().section(QLatin1Char('/'), -2).replace(QLatin1Char('/'), QLatin1Char('_'));
        QDir().mkpath(copy);
        ASSERT_TRUE(QFile::copy(file, copy + QLatin1Char('/') + QFileInfo(file).fileName()));
    }
    runTool(path("store"), address(),
            {QStringLiteral("add"), path("images")});  // what is no DICOM file there makes it end with 1
    // Only what was taken in, from the files that are shown.
    QMap<QString, QString> shown;
    for (const QJsonValue& each : list("studies?limit=1000")) {
        const QString uid = textOf(each, "0020000D");
        TagFile file;
        ASSERT_TRUE(file.readCacheFileForStudy(uid.toLatin1().constData(), false));
        for (const TagMap* image : file.imagesByUID()) {
            const QString name = QString::fromUtf8(filePathOf(*image));
            shown.insert(name, uid);
        }
    }
    for (auto each = shown.begin(); each != shown.end(); ++each)
        oracle.add(each.key());
    ASSERT_GT(oracle.size(), 40);

    std::mt19937 random(11);
    std::vector<DcmTagKey> keys = Oracle::kKeys;
    keys.push_back(DCM_ModalitiesInStudy);
    int found = 0;
    for (int i = 0; i < 400; ++i) {
        const DcmTagKey key = keys[random() % keys.size()];
        const bool isDate = key == DCM_StudyDate || key == DCM_PatientBirthDate;
        const QString value = oracle.valueOf(static_cast<int>(random() % 1000), key);
        const QString query = key == DCM_ModalitiesInStudy ? value : question(value, isDate, random);
        // Wildcards alone are no question that an index answers.
        if (query.trimmed() != query || !query.contains(QRegularExpression(QStringLiteral("[^*?^=]"))) ||
            (isDate && QRegularExpression(QStringLiteral("[^0-9-]")).match(query).hasMatch()))
            continue;
        const QByteArray target = QByteArray("studies?limit=1000&") +
                                  QByteArray::number((quint32(key.getGroup()) << 16) | key.getElement(), 16)
                                      .rightJustified(8, '0') +
                                  '=' + query.toUtf8().toPercentEncoding();
        QStringList studies;
        for (const QJsonValue& each : list(target))
            studies << textOf(each, "0020000D");
        studies.sort();
        EXPECT_EQ(studies.join(QLatin1Char(' ')).toStdString(),
                  oracle.find(key, query).join(QLatin1Char(' ')).toStdString())
            << target.toStdString() << " (" << query.toStdString() << ")";
        found += studies.size();
    }
    EXPECT_GT(found, 400);
}

}  // namespace
