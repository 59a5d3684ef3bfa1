#pragma once

#include "server/http/Response.h"

namespace Kdd::DicomWeb
{

// What those are told who want to change something.

/// 503: others work on the study.
Http::Response studyIsBusy();

/// 503: nothing can be changed without the database.
Http::Response databaseIsAway();

/// 503: too many change something already.
Http::Response tooManyChanges();

/// 400 for a request with a parameter that is not among `known`: one that is not understood may be what keeps it from doing
/// harm. Status 0: there is none.
Http::Response unknownParameter(const Http::Request& request, const QVector<QByteArray>& known);

}  // namespace Kdd::DicomWeb
