#pragma once

#include "server/access/Caller.h"
#include "server/http/Request.h"

namespace Kdd::Access
{

/// What a request asks for, as far as its path and method tell.
struct Asked
{
    enum class Verdict {
        Open,     ///< a file of the program's own pages, in which nothing of the archive stands
        Needs,    ///< `right`
        Unknown,  ///< no resource has this path
        NotSo,    ///< one has, but not by this method
    };

    /// How far an answer reaches, where somebody may not see all studies.
    enum class Reach {
        OneStudy,  ///< that is named in the request; whoever may not see it is answered as if there were none
        Limited,   ///< the resource itself keeps to the request's `studies`
        Nothing,   ///< there is nothing of any study in it
    };

    Verdict verdict = Verdict::Unknown;
    Reach reach = Reach::OneStudy;
    Right right = Right::Read;
    const char* kind = "other";  ///< of resource, for those who count and keep trails
    QByteArray study;            ///< that it is about; empty where it is not about one
};

/// The one table of what takes which right. What is not in it is answered to nobody.
class RightsTable
{
public:
    /// `prefix` leads to DICOMweb.
    explicit RightsTable(QVector<QByteArray> prefix)
        : mPrefix(std::move(prefix))
    {
    }

    /// The names of all resources of DICOMweb, as they stand in paths, for whoever has to look at each.
    static QVector<QByteArray> resources();

    Asked find(const Http::Request& request) const;

    /// The same request, for another study.
    Http::Request withStudy(const Http::Request& request, const QByteArray& study) const;

private:
    QVector<QByteArray> mPrefix;
};

}  // namespace Kdd::Access
