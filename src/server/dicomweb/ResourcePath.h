#pragma once

#include <QByteArray>
#include <QVector>

namespace Kdd::DicomWeb
{

/// What a path below the service's prefix names: an object by its UIDs, and what of it is asked for.
///
///     /studies                                        resource "studies"
///     /studies/1.2/series                             study "1.2", resource "series"
///     /studies/1.2/series/1.3/instances/1.4/frames/1  all three UIDs, resource "frames", rest "1"
///     /studies/1.2/series/1.3                         study, series, resource empty: the object itself
struct ResourcePath
{
    QByteArray study;
    QByteArray series;
    QByteArray instance;
    QByteArray resource;
    QVector<QByteArray> rest;  ///< segments behind the resource

    /// Of segments that begin with "studies", "series", "instances" or any other name, which is then the resource. False
    /// when a UID stands there that is none, or segments that name nothing follow.
    static bool parse(const QVector<QByteArray>& segments, ResourcePath& path);
};

/// Whether it can stand for a UID: 1 to 64 characters. Digits and points make one, but archives hold others, with letters,
/// "-" and "_", from software that hashed them.
bool isUID(const QByteArray& text);

}  // namespace Kdd::DicomWeb
