#include "server/ViewerFiles.h"

#include "server/http/RequestTarget.h"
#include "support/FileContent.h"

#include <QTemporaryDir>

#include <unistd.h>

using namespace Kdd;

namespace
{

class ViewerFilesTest : public testing::Test
{
protected:
    ViewerFilesTest()
    {
        write("secret.txt", "secret");
        write("viewer-not/a.js", "neighbour");
        write("viewer/index.html", "start");
        write("viewer/app.js", "program");
        write("viewer/assets/a b.svg", "picture");
        write("viewer/assets/data", "data");
        write("viewer/large.js", "program");
        write("viewer/large.js.gz", "shorter");
        link("app.js", "viewer/inside.js");
        link("../secret.txt", "viewer/outside.txt");
        link("..", "viewer/up");
        link("../viewer-not", "viewer/neighbour");
        mFiles = ViewerFiles::open(path("viewer"), 1, mResult);
    }

    QString path(const char* name) const { return mFolder.filePath(QString::fromLatin1(name)); }

    void write(const char* name, const QByteArray& content) const { putFile(path(name), content); }

    void link(const char* to, const char* name) const
    {
        EXPECT_EQ(::symlink(to, path(name).toLocal8Bit().constData()), 0);
    }

    Http::Response get(const QByteArray& target, const QVector<Http::Field>& headers = {}) const
    {
        Http::RequestTarget parsed;
        if (!Http::RequestTarget::parse(target, parsed))
            return Http::Response(400);
        Http::Request request;
        request.target = target;
        request.path = parsed.path;
        request.headers = headers;
        return mFiles->answer(request);
    }

    /// "200 text/css gzip content"
    static std::string shown(const Http::Response& response)
    {
        QByteArray text = QByteArray::number(response.status);
        for (const Http::Field& field : response.headers)
            if (field.name == "Content-Type" || field.name == "Content-Encoding" || field.name == "Location")
                text += ' ' + field.value.split(';')[0];
        for (const Http::BodyPart& part : response.body) {
            QByteArray bytes;
            if (const auto* range = std::get_if<Http::FileRange>(&part)) {
                EXPECT_TRUE(range->file->read(range->offset, range->length, bytes).good());
            }
            text += ' ' + bytes;
        }
        return text.trimmed().toStdString();
    }

    QTemporaryDir mFolder;
    Result mResult;
    std::unique_ptr<ViewerFiles> mFiles;
};

TEST_F(ViewerFilesTest, AreThoseBelowTheFolderAndNoOthers)
{
    const std::pair<const char*, const char*> kTargets[] = {
        {"/viewer/", "200 text/html start"},
        {"/viewer", "308 viewer/"},
        {"/viewer?a=b", "308 viewer/?a=b"},
        {"/viewer/index.html", "200 text/html start"},
        {"/viewer/app.js?v=1", "200 text/javascript program"},
        {"/viewer/assets/a%20b.svg", "200 image/svg+xml picture"},
        {"/viewer/assets/data", "200 application/octet-stream data"},
        {"/viewer/inside.js", "200 text/javascript program"},
        {"/viewer/viewer?StudyInstanceUIDs=1.2", "200 text/html start"},
        {"/viewer/assets", "200 text/html start"},
        {"/viewer/1.2.3", "200 text/html start"},
        {"/viewer/none.js", "404 text/plain"},
        {"/viewer/..\\secret.txt", "404 text/plain"},
        {"/viewer/outside.txt", "404 text/plain"},
        {"/viewer/up/secret.txt", "404 text/plain"},
        {"/viewer/up/viewer/app.js", "200 text/javascript program"},
        {"/viewer/neighbour/a.js", "404 text/plain"},
    };
    for (const auto& [target, expected] : kTargets) {
        const std::string answer = shown(get(target));
        EXPECT_EQ(answer.substr(0, answer.find(" The viewer")), expected) << target;
    }
}

TEST_F(ViewerFilesTest, AreSentCompressedToWhoTakesThemSo)
{
    const auto sent = [&](const char* target, const char* coding) {
        return shown(get(target, {{"accept-encoding", coding}}));
    };
    EXPECT_EQ(sent("/viewer/large.js", "gzip, br"), "200 text/javascript gzip shorter");
    EXPECT_EQ(sent("/viewer/large.js", "br"), "200 text/javascript program");
    EXPECT_EQ(sent("/viewer/large.js", "gzip;q=0"), "200 text/javascript program");
    EXPECT_EQ(sent("/viewer/app.js", "gzip"), "200 text/javascript program");
}

TEST_F(ViewerFilesTest, AreNotSentAgainToWhoHasThem)
{
    const Http::Response first = get("/viewer/app.js");
    QByteArray tag;
    for (const Http::Field& field : first.headers)
        if (field.name == "ETag")
            tag = field.value;
    EXPECT_EQ(shown(get("/viewer/app.js", {{"if-none-match", "\"x\", " + tag}})), "304");
    EXPECT_EQ(shown(get("/viewer/app.js", {{"if-none-match", "\"x\""}})), "200 text/javascript program");
    write("viewer/app.js", "another");
    EXPECT_EQ(shown(get("/viewer/app.js", {{"if-none-match", tag}})), "200 text/javascript another");
}

}  // namespace
