#include "server/dicomweb/uri/UriRequest.h"

#include <QList>

#include <cmath>

namespace Kdd::DicomWeb
{

namespace
{

Verdict wrong(const char* name, const char* form)
{
    return {400,
            QStringLiteral("The parameter %1 has to be %2").arg(QLatin1String(name), QLatin1String(form))};
}

Verdict readUid(const Http::Request& request, const char* name, QByteArray& uid)
{
    uid = request.parameter(name);
    return isUID(uid) ? Verdict() : wrong(name, "a UID");
}

bool readNumber(const QByteArray& text, double least, double most, double& number)
{
    bool isNumber = false;
    number = text.toDouble(&isNumber);
    return isNumber && std::isfinite(number) && number >= least && number <= most;
}

bool readInteger(const QByteArray& text, int most, int& number)
{
    bool isNumber = false;
    number = text.toInt(&isNumber);
    return isNumber && number >= 1 && number <= most;
}

/// Where only one side is given the other is as long as it becomes.
Verdict readSize(const Http::Request& request, RenderRequest& rendering)
{
    int sides[] = {kLongestSide, kLongestSide};
    const char* const names[] = {"columns", "rows"};
    bool isGiven = false;
    for (int i = 0; i < 2; ++i) {
        const QByteArray text = request.parameter(names[i]);
        if (text.isEmpty())
            continue;
        isGiven = true;
        if (!readInteger(text, kLongestSide, sides[i]))
            return wrong(names[i], "a number of pixels from 1 to 8192");
    }
    if (isGiven)
        rendering.viewport = QSize(sides[0], sides[1]);
    return {};
}

Verdict readRegion(const Http::Request& request, RenderRequest& rendering)
{
    const QByteArray text = request.parameter("region");
    if (text.isEmpty())
        return {};
    const QList<QByteArray> words = text.split(',');
    double edges[4] = {};
    bool isValid = words.size() == 4;
    for (int i = 0; i < 4 && isValid; ++i)
        isValid = readNumber(words[i], 0, 1, edges[i]);
    if (!isValid || edges[0] >= edges[2] || edges[1] >= edges[3])
        return wrong("region", "left,top,right,bottom in parts of the sides, from 0.0 to 1.0");
    rendering.region = {edges[0], edges[1], edges[2] - edges[0], edges[3] - edges[1], true};
    return {};
}

Verdict readWindow(const Http::Request& request, RenderRequest& rendering)
{
    const QByteArray center = request.parameter("windowCenter");
    const QByteArray width = request.parameter("windowWidth");
    if (center.isEmpty() && width.isEmpty())
        return {};
    constexpr double kMost = 1e30;  // beyond all pixel values, far from where sums overflow
    FrameWindow window;
    if (!readNumber(center, -kMost, kMost, window.center))
        return wrong("windowCenter", "a number, together with windowWidth");
    if (!readNumber(width, 1, kMost, window.width))
        return wrong("windowWidth", "a number from 1 on, together with windowCenter");
    rendering.window = window;
    return {};
}

Verdict readQuality(const Http::Request& request, RenderRequest& rendering)
{
    const QByteArray text = request.parameter("imageQuality");
    return text.isEmpty() || readInteger(text, 100, rendering.quality)
               ? Verdict()
               : wrong("imageQuality", "from 1 to 100");
}

Verdict readFrame(const Http::Request& request, QByteArray& frame)
{
    int number = 1;
    const QByteArray text = request.parameter("frameNumber");
    if (text.isEmpty())
        return {};
    if (!readInteger(text, 0x7fffffff, number))
        return wrong("frameNumber", "a number from 1 on");
    frame = QByteArray::number(number);
    return {};
}

Verdict readForm(const Http::Request& request, UriRequest& wanted)
{
    // The parameter stands for clients that cannot set the header, as pages of long ago.
    const QByteArray type = request.parameter("contentType").trimmed();
    const QByteArray accept = type.isEmpty() ? request.header("accept").trimmed() : type;
    if (!accept.isEmpty())
        wanted.accept = Http::AcceptHeader(accept);
    wanted.transferSyntax = request.parameter("transferSyntax");
    if (!wanted.transferSyntax.isEmpty() && !isUID(wanted.transferSyntax))
        return wrong("transferSyntax", "a UID");
    for (const char* name : {"annotation", "presentationUID", "presentationSeriesUID"}) {
        if (!request.parameter(name).isEmpty())
            wanted.notDone = name;
    }
    const QByteArray anonymize = request.parameter("anonymize");
    if (!anonymize.isEmpty() && anonymize != "no")
        return {400,
                QStringLiteral("Instances are not made anonymous here: ask without the parameter anonymize")};
    return {};
}

}  // namespace

Verdict UriRequest::parse(const Http::Request& request, UriRequest& wanted)
{
    if (request.parameter("requestType") != "WADO")
        return wrong("requestType", "WADO");
    Verdict verdict = readUid(request, "studyUID", wanted.path.study);
    if (verdict.good())
        verdict = readUid(request, "seriesUID", wanted.path.series);
    if (verdict.good())
        verdict = readUid(request, "objectUID", wanted.path.instance);
    if (verdict.good())
        verdict = readForm(request, wanted);
    if (verdict.good())
        verdict = readFrame(request, wanted.frame);
    for (const auto read : {readSize, readRegion, readWindow, readQuality}) {
        if (verdict.good())
            verdict = read(request, wanted.rendering);
    }
    return verdict;
}

}  // namespace Kdd::DicomWeb
