#pragma once

#include <QByteArray>
#include <QVector>

namespace Kdd::Http
{

enum class Method { Get, Head, Options, Post, Delete, Other };

/// As it is sent; "other" for one that nothing here takes.
const char* nameOf(Method method);

struct Field
{
    QByteArray name;
    QByteArray value;
};

/// A request as those who answer it see it: bounded, taken apart and decoded.
struct Request
{
    Method method = Method::Get;
    QByteArray target;  ///< as it was sent, for logs
    QVector<QByteArray>
        path;                ///< segments, percent-decoded; none is empty, "." or "..", or holds "/" or a NUL
    QVector<Field> query;    ///< decoded, in the order sent; a name may occur several times
    QVector<Field> headers;  ///< names in small letters
    QByteArray base;         ///< address by which the client reached this server, without "/" at its end
    QByteArray peer;         ///< address of whoever is at the other end of the connection
    bool isEncrypted = false;  ///< on its way from there
    QByteArray
        certificate;  ///< whom the certificate that the peer showed names, "CN=...,O=..."; empty: none was
    QByteArray id;    ///< of this request, in logs and in the answer's X-Request-Id

    // As those know who let it in:

    QByteArray caller;           ///< who sends it; empty: nobody in particular
    QVector<QByteArray> rights;  ///< what he may: "read", "store", "correct", "delete"

    /// The value of a header, named in small letters; of one sent several times the values joined by ", ". Null when
    /// it was not sent.
    QByteArray header(const char* name) const;

    /// The value of the first query parameter of that name; null when there is none.
    QByteArray parameter(const char* name) const;

    /// All values of query parameters of that name, in order.
    QVector<QByteArray> parameters(const char* name) const;
};

}  // namespace Kdd::Http
