#include "platform/resources/Setting.h"

#include "platform/base/LogFile.h"
#include "platform/os/PathName.h"

#include <QFile>
#include <QFileInfo>
#include <QHash>
#include <QSettings>
#include <QStandardPaths>
#include <QStringList>

namespace Kdd
{
namespace
{

using Values = QHash<QString, QByteArray>;

QString filePath()
{
    QString named = QFile::decodeName(qgetenv("KDD_CONFIG"));
    if (!named.isEmpty())
        return named;
    return QStandardPaths::writableLocation(QStandardPaths::GenericConfigLocation) +
           QLatin1String("/kdd/kdd.ini");
}

Values readFile()
{
    const QString path = filePath();
    // Nothing is read then, because Qt would look for a file of another name.
    if (!isPlainText(qgetenv("KDD_CONFIG"))) {
        LogFile::warnf("The settings in %s cannot be read: the name is no text",
                       qgetenv("KDD_CONFIG").constData());
        return {};
    }
    // Nobody has to have a file, but one that is named is meant to be there.
    const bool isNamed = !qEnvironmentVariableIsEmpty("KDD_CONFIG");
    if (!QFileInfo::exists(path) && !isNamed)
        return {};
    QSettings file(path, QSettings::IniFormat);
    // Qt would take Latin-1 otherwise, whatever the locale is.
    file.setIniCodec("UTF-8");
    Values values;
    const QStringList keys = file.allKeys();
    // What looks like a list is a value with commas that nobody put in quotes.
    for (const QString& key : keys)
        values.insert(key, file.value(key).toStringList().join(QLatin1Char(',')).toUtf8());
    if (file.status() != QSettings::NoError || !QFileInfo(path).isReadable())
        LogFile::warnf("The settings in %s cannot be read", qUtf8Printable(path));
    return values;
}

}  // namespace

QByteArray valueOf(const Setting& setting)
{
    // Asked anew each time, while the file is read once.
    QByteArray fromEnvironment = qgetenv(setting.variable);
    if (!fromEnvironment.isEmpty())
        return fromEnvironment;
    // A copy, because an object that reads settings must not be shared by threads.
    static const Values fromFile = readFile();
    return fromFile.value(QLatin1String(setting.key), setting.standard);
}

int numberOf(const Setting& setting, int least, int most)
{
    const QByteArray text = valueOf(setting);
    bool isNumber = false;
    const int number = text.toInt(&isNumber);
    if (isNumber && number >= least && number <= most)
        return number;
    LogFile::warnf("%s is \"%s\", which is no number of %d to %d; %s is taken", setting.variable,
                   text.constData(), least, most, setting.standard);
    return QByteArray(setting.standard).toInt();
}

}  // namespace Kdd
