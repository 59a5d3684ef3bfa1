#include "server/http/RequestId.h"

#include <QRandomGenerator>

#include <algorithm>
#include <atomic>
#include <cstring>

namespace Kdd::Http
{
namespace
{

constexpr int kLongestId = 64;

bool isWord(const QByteArray& text)
{
    return !text.isEmpty() && text.size() <= kLongestId &&
           std::all_of(text.begin(), text.end(), [](char each) {
               return (each >= 'a' && each <= 'z') || (each >= 'A' && each <= 'Z') ||
                      (each >= '0' && each <= '9') || each == '-' || each == '_' || each == '.';
           });
}

}  // namespace

QByteArray requestId(const QByteArray& given)
{
    if (isWord(given))
        return given;
    // The process and a number: servers side by side, and one that is started again, do not meet.
    static const QByteArray sProcess = QByteArray::number(QRandomGenerator::system()->generate64(), 36);
    static std::atomic<quint64> sNumber{0};
    return sProcess + '-' + QByteArray::number(++sNumber, 36);
}

}  // namespace Kdd::Http
