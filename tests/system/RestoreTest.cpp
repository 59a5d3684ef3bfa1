#include "server/faults/Served.h"

using namespace Kdd;

namespace
{

/// What of an archive is brought back from a backup.
struct Restored
{
    const char* name;
    std::vector<const char*> old;   // what is as it was at the backup
    std::vector<const char*> gone;  // what there was no backup of
    const char* images;             // that are shown then
    const char* corrected;          // the patient of image 3, which was corrected after the backup
    int exitCode;
};

class Restore : public Served, public testing::WithParamInterface<Restored>
{
protected:
    void store(const std::vector<int>& images)
    {
        serve("--stow");
        for (const int number : images) {
            const QByteArray uid = "1.2.3." + QByteArray::number(number);
            save(uid.constData(), anImage(uid).with(DCM_PatientName, "Doe^J"));
            EXPECT_EQ(ask("POST", "studies", "application/dicom", bytes(uid.constData())).status, 200);
        }
        EXPECT_EQ(end(), 0);
        EXPECT_EQ(kdd("build --settle").exitCode, 0);
    }

    void correct(const QByteArray& image) const
    {
        const QByteArray edit = "qa " + job(DCM_PatientName, "Roe^R");
        EXPECT_EQ(kdd(edit + " --study 1.2 --image " + image).exitCode, 0);
    }

    void copy(const char* from, const char* to) const
    {
        EXPECT_EQ(QProcess::execute(QStringLiteral("cp"), {QStringLiteral("-a"), path(from), path(to)}), 0);
    }

    void bringBack(const QByteArray& part) const
    {
        drop(part);
        copy("backup/" + part, "store/" + part);
    }

    void drop(const QByteArray& part) const
    {
        QDir(path("store/" + part)).removeRecursively();
        QFile::remove(path("store/" + part));
    }

    /// What the metadata say of each image, by the last component of its UID.
    QMap<QByteArray, QByteArray> patients() const
    {
        QMap<QByteArray, QByteArray> found;
        for (const QJsonValue& image : jsonAt(kdd("metadata 1.2").out).toArray())
            found.insert(jsonAt(image, "00080018/Value/0").toString().toLatin1().mid(6),
                         jsonAt(image, "00100010/Value/0/Alphabetic").toString().toUtf8());
        return found;
    }
};

const Restored kRestored[] = {
    {"OldDatabase", {"kdd.sqlite"}, {}, "1 2 3 4 5 6", "Roe^R", 0},
    {"OldTagFiles", {"meta"}, {}, "1 3 4 5 6", "Roe^R", 0},
    {"OldDatabaseAndTagFiles", {"kdd.sqlite", "meta"}, {}, "1 2 3 4 5 6", "Doe^J", 0},
    {"OldObjects", {"objects"}, {}, "1 3 4 5 6", "Roe^R", 1},
    {"OldTagFilesAndObjects", {"meta", "objects"}, {}, "1 3", "Roe^R", 1},
    {"NoTagFiles", {}, {"meta"}, "1 3 4 5 6", "Roe^R", 0},
    {"NoTagFilesAndOldDatabase", {"kdd.sqlite"}, {"meta"}, "1 2 3 4 5 6", "Doe^J", 0},
    {"NoDatabase", {}, {"kdd.sqlite"}, "1 2 3 4 5 6", "Roe^R", 0},
    {"Nothing", {}, {}, "1 3 4 5 6", "Roe^R", 0},
};

INSTANTIATE_TEST_SUITE_P(Parts, Restore, testing::ValuesIn(kRestored),
                         [](const auto& restored) { return std::string(restored.param.name); });

TEST_P(Restore, OneCommandBringsTogetherWhatIsOfDifferentAges)
{
    store({1, 2, 3});
    correct("1.2.3.1");
    copy("store", "backup");
    store({4, 5, 6});
    correct("1.2.3.3");
    EXPECT_EQ(kdd("delete 1.2 --image 1.2.3.2").exitCode, 0);
    for (const char* part : GetParam().old)
        bringBack(part);
    for (const char* part : GetParam().gone)
        drop(part);
    kdd("index", {path("none")});  // makes a database where there is none
    const Answer built = kdd("build --restored");
    EXPECT_EQ(built.exitCode, GetParam().exitCode) << built.err.toStdString();
    const QMap<QByteArray, QByteArray> shown = patients();
    EXPECT_EQ(QByteArrayList(shown.keys()).join(' ').toStdString(), GetParam().images)
        << built.err.toStdString();
    EXPECT_EQ(shown.value("1").toStdString(), "Roe^R");
    EXPECT_EQ(shown.value("3").toStdString(), GetParam().corrected);
    EXPECT_EQ(kdd("verify --all").exitCode, GetParam().exitCode);
    EXPECT_EQ(kdd("build --restored").exitCode, GetParam().exitCode)
        << "nothing more comes of doing it again";
    EXPECT_EQ(patients(), shown);
}

}  // namespace
