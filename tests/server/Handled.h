#pragma once

#include "server/http/Request.h"
#include "server/http/Response.h"

#include <QByteArrayList>

#include <gtest/gtest.h>

namespace Kdd
{

// What handlers are asked without a server between, and what they answer.

using Headers = QVector<Http::Field>;

/// "/studies/1.2?limit=5", whose parameters are percent-decoded.
inline Http::Request requestFor(const QByteArray& target, const Headers& headers = {},
                                Http::Method method = Http::Method::Get)
{
    Http::Request request;
    request.method = method;
    request.target = target;
    request.headers = headers;
    const QByteArray path = target.split('?').front();
    for (const QByteArray& segment : path.split('/'))
        if (!segment.isEmpty())
            request.path.append(segment);
    for (const QByteArray& field : target.mid(path.size() + 1).split('&'))
        if (!field.isEmpty())
            request.query.append(
                {QByteArray::fromPercentEncoding(field.split('=').front()),
                 QByteArray::fromPercentEncoding(field.mid(field.split('=').front().size() + 1))});
    return request;
}

/// All of the headers of that name, joined by ", ".
inline QByteArray headerOf(const Http::Response& response, const char* name)
{
    QByteArray values;
    for (const Http::Field& each : response.headers)
        if (each.name == name)
            values += (values.isEmpty() ? "" : ", ") + each.value;
    return values;
}

/// Its bytes, what is to be sent of files, and what is made as it is sent; "broken off" where that ends early.
inline QByteArray bodyOf(const Http::Response& response)
{
    QByteArray body;
    QByteArray block;
    for (const Http::BodyPart& part : response.body) {
        if (const auto* bytes = std::get_if<QByteArray>(&part)) {
            body += *bytes;
        } else if (const auto* range = std::get_if<Http::FileRange>(&part)) {
            EXPECT_TRUE(range->file->read(range->offset, range->length, block).good());
            body += block;
        } else {
            auto& producer = *std::get<std::unique_ptr<Http::Producer>>(part);
            do {
                if (producer.next(block).bad())
                    return "broken off";
                body += block;
            } while (!block.isEmpty());
        }
    }
    return body;
}

}  // namespace Kdd
