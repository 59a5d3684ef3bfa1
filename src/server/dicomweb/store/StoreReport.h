#pragma once

#include "server/http/Response.h"

#include <QJsonArray>

#include <kddlib/ObjectStore.h>

namespace Kdd::DicomWeb
{

/// What became of the objects of one request, one entry for each, as its answer tells it.
class StoreReport
{
public:
    /// `root` is the address of DICOMweb. With `studyUID` not empty all were sent to that study.
    StoreReport(const QByteArray& root, const QByteArray& studyUID)
        : mRoot(root)
        , mStudyUID(studyUID)
    {
    }

    void add(const ArrivedObject& object);

    int stored() const { return mStored.size(); }
    int failed() const { return mFailed.size() + mOthers.size(); }

    enum class Form { Json, Xml };

    /// 200: all are stored; 202: some; 409: none; 503: none, for want of room or because the database or the disk failed.
    /// `badStatus`, not 0, is that of a request that broke off, where nothing was stored.
    Http::Response response(Form form, int badStatus) const;

private:
    int status(int badStatus) const;

    QByteArray mRoot;
    QByteArray mStudyUID;
    QByteArray mOneStudy;  // of all that are stored, as long as it is one
    bool mAreOfOneStudy = true;
    bool mIsOutOfSpace = false;
    bool mMayComeAgain = false;  // with one at least nothing is wrong
    QJsonArray mStored;
    QJsonArray mFailed;
    QJsonArray mOthers;  // of which it is not known what they are
};

/// The status that tells why an object was not stored, as an association would; 0 for one that is.
int failureReason(ArrivalFault fault);

}  // namespace Kdd::DicomWeb
