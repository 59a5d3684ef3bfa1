#pragma once

#include <QString>
#include <QStringList>

#include <set>
#include <string>
#include <vector>

namespace Kdd
{

/// A fenced block of a page of the documentation.
struct Block
{
    QString page;  ///< "settings.md"
    QString language;
    QString text;
    int line = 0;  ///< of the fence, 1-based

    std::string place() const { return (page + QLatin1Char(':') + QString::number(line)).toStdString(); }

    /// Of a console block the commands, without the prompt.
    QStringList commands() const;
};

QString pageText(const QString& path);

/// The groups of all matches, joined by a blank where there are more than one.
std::set<std::string> matches(const QString& text, const char* pattern);

/// The blocks of README.md, CONTRIBUTING.md and docs/*.md.
std::vector<Block> allBlocks();
std::vector<Block> blocksIn(const char* language);

}  // namespace Kdd
