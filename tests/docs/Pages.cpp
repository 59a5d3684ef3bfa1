#include "Pages.h"

#include <QDir>
#include <QFile>
#include <QRegularExpression>

#include <gtest/gtest.h>

namespace Kdd
{

QString pageText(const QString& path)
{
    QFile file(QStringLiteral(KDD_SOURCES "/") + path);
    EXPECT_TRUE(file.open(QIODevice::ReadOnly)) << path.toStdString();
    return QString::fromUtf8(file.readAll());
}

std::set<std::string> matches(const QString& text, const char* pattern)
{
    std::set<std::string> found;
    const QRegularExpression expression(QString::fromLatin1(pattern), QRegularExpression::MultilineOption);
    for (auto it = expression.globalMatch(text); it.hasNext();)
        found.insert(it.next().capturedTexts().mid(1).join(QLatin1Char(' ')).toStdString());
    return found;
}

QStringList Block::commands() const
{
    QStringList commands;
    for (const QString& typed : text.split(QLatin1Char('\n'), Qt::SkipEmptyParts)) {
        EXPECT_TRUE(typed.startsWith(QLatin1String("$ "))) << place() << ": " << typed.toStdString();
        commands.append(typed.mid(2));
    }
    return commands;
}

std::vector<Block> allBlocks()
{
    const QString fence = QStringLiteral("```");
    QStringList pages = {QStringLiteral("README.md"), QStringLiteral("CONTRIBUTING.md")};
    for (const QString& name : QDir(QStringLiteral(KDD_SOURCES "/docs")).entryList({QStringLiteral("*.md")}))
        pages.append(QStringLiteral("docs/") + name);
    std::vector<Block> blocks;
    for (const QString& page : qAsConst(pages)) {
        bool isInside = false;
        int number = 0;
        for (const QString& line : pageText(page).split(QLatin1Char('\n'))) {
            ++number;
            if (line.startsWith(fence)) {
                isInside = !isInside;
                if (isInside)
                    blocks.push_back({page, line.mid(3).trimmed(), QString(), number});
            } else if (isInside) {
                blocks.back().text += line + QLatin1Char('\n');
            }
        }
        EXPECT_FALSE(isInside) << page.toStdString() << " ends inside a block";
    }
    return blocks;
}

std::vector<Block> blocksIn(const char* language)
{
    std::vector<Block> blocks;
    for (const Block& block : allBlocks()) {
        if (block.language == QLatin1String(language))
            blocks.push_back(block);
    }
    return blocks;
}

}  // namespace Kdd
