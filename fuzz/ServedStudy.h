#pragma once

#include "server/dicomweb/StudyShelf.h"
#include "server/dicomweb/retrieve/ObjectShelf.h"
#include "server/dicomweb/search/ThreadSearch.h"
#include "server/http/Response.h"

#include <QTemporaryDir>

#include <kddlib/TagFile.h>
#include <kddlib/TagMap.h>

#include <memory>
#include <vector>

namespace Kdd
{

/// A store of one study, "1.2", that is another one in each run: of its files, its tag file, and what answers from them. Lies in
/// memory where the system has a place there. Used by one thread.
class ServedStudy
{
public:
    /// With an image database, which knows the study, there are also searches.
    enum class Database { None, Sqlite };

    explicit ServedStudy(Database database);
    ~ServedStudy();

    /// Makes these files the study. False, and the study of the run before stays, when they are none that would be taken in.
    bool replace(const std::vector<QByteArray>& files);

    /// The study is as its tag file has it, whatever changed that.
    void touch();

    /// The answer below the prefix of DICOMweb, or of the study browser for a path that begins with "browser". Parameters stand
    /// as they are decoded.
    Http::Response get(const QByteArray& path, const QVector<Http::Field>& query = {},
                       const QByteArray& accept = "*/*");

    /// All of its bytes; that it is broken off ends the process.
    static QByteArray bodyOf(Http::Response& response);

    /// The value of a header; empty when there is none.
    static QByteArray headerOf(const Http::Response& response, const char* name);

    QByteArray filePath(int number) const;
    const DicomWeb::ThreadSearch& database() const { return *mDatabase; }
    DicomWeb::StudyShelf& shelf() { return *mStudies; }

private:
    void addResources();
    void addSearches();
    void setTime(const QByteArray& path);

    QTemporaryDir mFolder;
    std::shared_ptr<DicomWeb::StudyShelf> mStudies;
    std::shared_ptr<DicomWeb::ObjectShelf> mObjects;
    std::unique_ptr<DicomWeb::ThreadSearch> mDatabase;
    std::unique_ptr<Http::Handler> mDicomWeb;
    std::unique_ptr<Http::Handler> mBrowser;
    qint64 mTime = 0;  // of the files [s]; each state has its own
};

}  // namespace Kdd
