#include "server/dicomweb/change/ChangeAnswer.h"

namespace Kdd::DicomWeb
{
namespace
{

Http::Response later(const QString& reason, const char* seconds)
{
    Http::Response response = Http::failure(503, reason);
    response.addHeader("Retry-After", seconds);
    return response;
}

}  // namespace

Http::Response studyIsBusy()
{
    return later(QStringLiteral("Others work on the study, and nothing was changed; ask again"), "10");
}

Http::Response databaseIsAway()
{
    return later(QStringLiteral("The image database cannot be asked now, and nothing was changed"), "10");
}

Http::Response tooManyChanges()
{
    return later(QStringLiteral("Too many change something at a time; ask again"), "2");
}

Http::Response unknownParameter(const Http::Request& request, const QVector<QByteArray>& known)
{
    for (const Http::Field& field : request.query) {
        if (!known.contains(field.name))
            return Http::failure(
                400, QStringLiteral("There is no parameter \"%1\" here").arg(QString::fromUtf8(field.name)));
    }
    return Http::Response(0);
}

}  // namespace Kdd::DicomWeb
