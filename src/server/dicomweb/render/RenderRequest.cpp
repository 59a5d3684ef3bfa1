#include "server/dicomweb/render/RenderRequest.h"

#include <QList>
#include <QVector>

#include <cmath>

namespace Kdd::DicomWeb
{
namespace
{

/// Numbers between commas; an empty one is left at its default. False when one is none, or too many or few are there.
bool readNumbers(const QByteArray& text, int least, QVector<double>& numbers)
{
    const QList<QByteArray> words = text.split(',');
    if (words.size() < least || words.size() > numbers.size())
        return false;
    for (int i = 0; i < words.size(); ++i) {
        if (words[i].isEmpty() && i >= least)
            continue;
        bool isNumber = false;
        numbers[i] = words[i].toDouble(&isNumber);
        if (!isNumber || !std::isfinite(numbers[i]))
            return false;
    }
    return true;
}

bool readViewport(const QByteArray& text, RenderRequest& rendering)
{
    QVector<double> numbers(6);
    if (!readNumbers(text, 2, numbers))
        return false;
    for (int side = 0; side < 2; ++side)
        if (!(numbers[side] >= 1 && numbers[side] <= kLongestSide))
            return false;
    if (numbers[2] < 0 || numbers[3] < 0)
        return false;
    rendering.viewport = QSize(static_cast<int>(numbers[0]), static_cast<int>(numbers[1]));
    rendering.region = {numbers[2], numbers[3], numbers[4], numbers[5], false};
    return true;
}

bool readFunction(const QByteArray& name, FrameWindow::Function& function)
{
    const struct
    {
        const char* name;
        FrameWindow::Function function;
    } functions[] = {{"linear", FrameWindow::Function::Linear},
                     {"linear-exact", FrameWindow::Function::LinearExact},
                     {"sigmoid", FrameWindow::Function::Sigmoid}};
    for (const auto& each : functions) {
        if (name != each.name)
            continue;
        function = each.function;
        return true;
    }
    return false;
}

bool readWindow(const QByteArray& text, RenderRequest& rendering)
{
    const QList<QByteArray> words = text.split(',');
    QVector<double> numbers(2);
    if (words.size() < 2 || words.size() > 3 || !readNumbers(words[0] + ',' + words[1], 2, numbers))
        return false;
    FrameWindow window;
    window.center = numbers[0];
    window.width = numbers[1];
    // The standard wants the function named; viewers leave it out.
    if (words.size() == 3 && !readFunction(words[2].toLower(), window.function))
        return false;
    const double least = window.function == FrameWindow::Function::Linear ? 1 : 0;
    if (!(window.width > 0 && window.width >= least))
        return false;
    rendering.window = window;
    return true;
}

bool readQuality(const QByteArray& text, RenderRequest& rendering)
{
    bool isNumber = false;
    rendering.quality = text.toInt(&isNumber);
    return isNumber && rendering.quality >= 1 && rendering.quality <= 100;
}

}  // namespace

Verdict RenderRequest::parse(const Http::Request& request, RenderRequest& rendering)
{
    const struct
    {
        const char* name;
        bool (*read)(const QByteArray&, RenderRequest&);
        const char* form;
    } parameters[] = {{"viewport", readViewport, "width,height[,x,y,width,height], sides from 1 to 8192"},
                      {"window", readWindow, "center,width,linear|linear-exact|sigmoid"},
                      {"quality", readQuality, "1 to 100"}};
    for (const auto& each : parameters) {
        const QByteArray value = request.parameter(each.name);
        if (!value.isNull() && !each.read(value, rendering))
            return {400, QStringLiteral("The parameter %1 has the form %2")
                             .arg(QLatin1String(each.name), QLatin1String(each.form))};
    }
    return {};
}

QByteArray RenderRequest::text() const
{
    constexpr int kDigits = 17;  // all that a number has
    QByteArray text;
    const auto add = [&](double number) { text += QByteArray::number(number, 'g', kDigits) + ','; };
    for (const double number : {double(viewport.width()), double(viewport.height()), region.x, region.y,
                                region.width, region.height, double(region.isRelative), double(quality)})
        add(number);
    if (window) {
        add(window->center);
        add(window->width);
        add(static_cast<int>(window->function));
    }
    return text;
}

}  // namespace Kdd::DicomWeb
