#include "support/ObjectServer.h"

#include <random>

namespace Kdd
{

QByteArray someObject(int size)
{
    QByteArray bytes(size, '\0');
    std::minstd_rand random(static_cast<unsigned>(size));
    for (char& byte : bytes)
        byte = static_cast<char>(random() >> 8);
    return bytes;
}

ScriptedServer::Reply ObjectServer::reply(const QByteArray& request) const
{
    const QByteArray range = headerOf(request, "Range").mid(int(qstrlen("bytes=")));
    if (range.isEmpty())
        return {httpResponse(mObject)};
    Answer answer;
    answer.first = range.split('-').at(0).toInt();
    answer.last = qMin(range.split('-').at(1).toInt(), mObject.size() - 1);
    answer.total = QByteArray::number(mObject.size());
    answer.body = mObject.mid(int(answer.first), int(answer.last - answer.first + 1));
    if (mSpoil)
        mSpoil(answer);
    return {"HTTP/1.1 " + QByteArray::number(answer.code) + " -\r\nETag: " + answer.entityTag +
                "\r\nContent-Range: bytes " + QByteArray::number(answer.first) + '-' +
                QByteArray::number(answer.last) + '/' + answer.total + "\r\n\r\n" + answer.body,
            {},
            answer.resets};
}

}  // namespace Kdd
