#include "Pages.h"

#include <QDirIterator>

#include <gtest/gtest.h>

#include <map>
#include <set>

using namespace Kdd;

namespace
{

/// Every C++ source below the folder by its path.
std::map<QString, QString> sources(const QString& folder = QStringLiteral("src"))
{
    std::map<QString, QString> texts;
    const QDir root(QStringLiteral(KDD_SOURCES));
    for (QDirIterator it(root.filePath(folder), {QStringLiteral("*.h"), QStringLiteral("*.cpp")}, QDir::Files,
                         QDirIterator::Subdirectories);
         it.hasNext();) {
        const QString path = root.relativeFilePath(it.next());
        texts[path] = pageText(path);
    }
    return texts;
}

TEST(SettingsPage, NamesEveryVariableThatIsReadAndNoOtherWithItsPlaceInTheFileAndItsDefault)
{
    std::set<std::string> read;
    for (const auto& [path, text] : sources()) {
        if (!matches(text, "(getenv|qEnvironmentVariable|envname|constexpr Setting )").empty())
            read.merge(matches(text, "\"([A-Z]+_[A-Z_]+)\""));
    }
    EXPECT_GT(read.size(), 20U);
    const QString page = pageText(QStringLiteral("docs/settings.md"));
    EXPECT_EQ(matches(page, "^\\| `([A-Z_]+)` \\|"), read);
    const QString source = pageText(QStringLiteral("src/platform/resources/ExResource.cpp"));
    const char* const kInPage = "^\\| `([A-Z_]+)` \\| `\\[([a-z]+)\\]` `([a-z]+)` \\|";
    EXPECT_EQ(matches(page, kInPage), matches(source, "\\{\"([A-Z_]+)\", \"([a-z]+)/([a-z]+)\",\\s"));
    EXPECT_EQ(matches(page, (kInPage + std::string(" `([^`]+)` \\|")).c_str()),
              matches(source, "\\{\"([A-Z_]+)\", \"([a-z]+)/([a-z]+)\",\\s+\"([^\"]+)\"\\}"));
}

TEST(SettingsPage, NamesWhatTheServicesSettingsBeginWith)
{
    const std::set<std::string> known =
        matches(pageText(QStringLiteral("docs/settings.md")), "\\| `\\[([a-z]+)\\]` `([a-z]+)` \\|");
    QString section;
    int count = 0;
    for (const QString& line :
         pageText(QStringLiteral("packaging/systemd/kdd.ini")).split(QLatin1Char('\n'))) {
        if (line.startsWith(QLatin1Char('[')))
            section = line.mid(1, line.size() - 2);
        const std::set<std::string> key = matches(line, "^(?:; )?([a-z]+)=");
        if (key.empty())
            continue;
        EXPECT_EQ(known.count(section.toStdString() + ' ' + *key.begin()), 1U) << line.toStdString();
        ++count;
    }
    EXPECT_GT(count, 4);
}

TEST(ThreadsPage, TellsOfEveryClassThatIsExportedAndSoDoesItsHeader)
{
    std::set<std::string> exported;
    for (const auto& [path, text] : sources()) {
        const std::set<std::string> here = matches(text, "^(?:class|struct) KDD_EXPORT ([\\w:]+)");
        exported.insert(here.begin(), here.end());
        const char* const kWithComment =
            "(?:^///.*thread.*\\n)(?:^///.*\\n)*^(?:class|struct) KDD_EXPORT ([\\w:]+)";
        EXPECT_EQ(matches(text, kWithComment), here)
            << "the comment says nothing of threads: " << path.toStdString();
    }
    std::set<std::string> told;
    for (const std::string& cell : matches(pageText(QStringLiteral("docs/threads.md")), "^\\| (`[^|]+) \\|"))
        told.merge(matches(QString::fromStdString(cell), "`([\\w:]+)`"));
    EXPECT_EQ(told, exported);
}

/// The tests that there are, "Suite.Name".
std::set<std::string> testsThere()
{
    std::set<std::string> there;
    for (const auto& [path, text] : sources(QStringLiteral("tests"))) {
        for (std::string name : matches(text, "^TEST(?:_F|_P)?\\((\\w+),\\s+(\\w+)\\)")) {
            name[name.find(' ')] = '.';
            there.insert(name);
        }
    }
    return there;
}

/// Those that the page names and that are not there.
std::set<std::string> testsMissing(const QString& page)
{
    const std::set<std::string> there = testsThere();
    std::set<std::string> missing;
    for (const std::string& named : matches(page, "`(\\w+\\.\\w+)`")) {
        if (there.count(named) == 0)
            missing.insert(named);
    }
    return missing;
}

TEST(ThreatsPage, NamesForEachThreatATestThatIsThere)
{
    const QString page = pageText(QStringLiteral("docs/threats.md"));
    EXPECT_EQ(testsMissing(page), std::set<std::string>());
    EXPECT_EQ(matches(page, "^(\\| [^*`|]+ \\| [^|]+ \\|) [^`|]*\\|$"),
              std::set<std::string>{"| threat | what stands against it |"});
}

TEST(LimitsPage, HasForEachLimitATestOrAtLeastItsNumberInTheSource)
{
    const std::set<std::string> limits =
        matches(pageText(QStringLiteral("docs/limits.md")), "^\\| (?!what \\|)([^|]*[^-|][^|]*) \\|");
    EXPECT_GT(limits.size(), 80U);
    const QString page = pageText(QStringLiteral("docs/limits-held.md"));
    EXPECT_EQ(matches(page, "^\\| (?!limit \\|)([^|]*[^-|][^|]*) \\|"), limits);
    EXPECT_EQ(testsMissing(page), std::set<std::string>());
    // Neither a test nor a number.
    EXPECT_EQ(matches(page, "^\\| (?!limit \\|)([^|]+) \\|[^`]*$"), std::set<std::string>());
    const std::map<QString, QString> code = sources();
    for (const std::string& cell : matches(page, "(`src/[^|]*) \\|$")) {
        for (const QString& file : QString::fromStdString(cell).split(QStringLiteral("; "))) {
            const int colon = file.indexOf(QStringLiteral("`: "));
            const QString path = file.mid(1, colon - 1);
            ASSERT_EQ(code.count(path), 1U) << path.toStdString();
            for (const std::string& number : matches(file.mid(colon + 2), "`([^`]+)`"))
                EXPECT_TRUE(code.at(path).contains(QString::fromStdString(number)))
                    << path.toStdString() << " has no " << number;
        }
    }
}

}  // namespace
