#include <QProcess>
#include <QRegularExpression>
#include <QStringList>

#include <gtest/gtest.h>

namespace
{

const char* const kFunctions =
    "CloseStream ConfigureLogging CreateUserInfo DeleteImagesInTagFile DeleteObject DeleteSeriesInTagFile "
    "DeleteTagFile DeleteUserInfo FreeTagFileData GetVideoMetaInfo OpenStream OpenStreamRange "
    "ReadAndSyncTagFileData ReadBytes ReadDicomFromUrl StreamContentLength StringIsUrl UpdateTagFile "
    "UpdateTagFileW";

TEST(Exports, AreTheFunctionsOfTheCInterfaceAndClassesOfOurs)
{
    QProcess nm;
    nm.start(QStringLiteral("nm"), {QStringLiteral("-DC"), QStringLiteral("--defined-only"),
                                    QStringLiteral("--format=posix"), QStringLiteral(KDD_LIBRARY)});
    ASSERT_TRUE(nm.waitForFinished() && nm.exitCode() == 0) << nm.readAllStandardError().constData();
    const QString all = QString::fromUtf8(nm.readAllStandardOutput());
    const QRegularExpression ours(
        QStringLiteral("^((typeinfo|typeinfo name|vtable|VTT|guard variable|"
                       "(non-)?virtual thunk) (for|to) )?(Kdd|Kxg)::|^qx(Unc|C)ompress\\("));
    QStringList functions;
    for (const QString& line : all.split(QLatin1Char('\n'), Qt::SkipEmptyParts)) {
        if (!line.contains(ours))
            functions.append(line.section(QLatin1Char(' '), 0, 0));
    }
    functions.sort();
    EXPECT_EQ(functions.join(QLatin1Char(' ')).toStdString(), kFunctions);
    for (const char* name :
         {"Kdd::DcmInputCurlStream::DcmInputCurlStream(", "Kdd::DcmInputHttpStream::DcmInputHttpStream(",
          "Kdd::DcmHttpProducer::request(", "vtable for Kdd::DownloadProducer"})
        EXPECT_TRUE(all.contains(QLatin1String(name))) << name;
}

}  // namespace
