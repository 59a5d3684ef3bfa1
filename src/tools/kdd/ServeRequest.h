#pragma once

#include "tools/kdd/Commands.h"

namespace Kdd
{

/// What the command line says of associations; what is empty is left to the site's settings.
struct DimseRequest
{
    QByteArray listen;
    QByteArray title;
    QString peers;

    /// Declares `--dicom`, `--title` and `--peers`.
    void addTo(ArgumentList& arguments);

    /// All but where to listen.
    void addRulesTo(ArgumentList& arguments);
};

/// What it says of a server. What is empty or 0 is left to the site's settings.
struct ServeRequest
{
    QByteArray listen;
    QByteArray status;
    QString access;
    QString certificate;
    QString key;
    int threads = 0;
    QString viewer;
    QByteArray publicAddress;
    QList<QByteArray> hosts;
    bool stow = false;
    DimseRequest dimse;
    bool corrections = false;
    bool deletions = false;
};

}  // namespace Kdd
