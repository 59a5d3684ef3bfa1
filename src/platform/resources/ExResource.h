#pragma once

#include "platform/base/Export.h"

#include <QByteArray>

namespace Kdd
{

/// What differs from site to site. Each setting comes from its environment variable where that is set and not empty,
/// else from the site's file, else it is what stands here.
///
/// The file is an INI file in UTF-8: the one that the environment variable KDD_CONFIG names, else kdd/kdd.ini in the
/// user's configuration folder. It is read once, when the first setting is asked for; one that cannot be read is
/// warned about. Values with a comma, semicolon or backslash stand in double quotes there.
///
/// May be used on any thread.
class KDD_EXPORT ExResource
{
public:
    /// Under which host, with a port if need be, the own web service is reached. KDD_WEB_HOST, web/host, "localhost".
    static QByteArray getWebServiceHostExternal();

    // The cloud storage's addresses, each with the "/" that the bucket follows.

    /// Reads of objects. KDD_CLOUD_DOWNLOAD, cloud/download, the public download host.
    static QByteArray cloudDownloadEndpoint();

    /// Writes. KDD_CLOUD_UPLOAD, cloud/upload, the public upload host.
    static QByteArray cloudUploadEndpoint();

    /// All else. KDD_CLOUD_API, cloud/api, the public host.
    static QByteArray cloudApiEndpoint();

    /// Where access tokens come from when a key does not say so. KDD_CLOUD_TOKEN, cloud/token, the public address.
    static QByteArray cloudTokenEndpoint();

    /// Address of the image database. KDD_DATABASE, database/address, empty: none.
    static QByteArray databaseAddress();

    /// Folder of the tag files. KDD_META_FOLDER, folders/meta, empty: the image database knows it.
    static QByteArray metaFolder();

    /// Folder of the file cache. KDD_FILE_CACHE, folders/filecache, empty: there is no file cache.
    static QByteArray fileCacheFolder();

    /// Folder of the answers that `kdd serve` keeps ready. KDD_ANSWERS, folders/answers, empty: "answers" in the folder of
    /// the tag files.
    static QByteArray answersFolder();

    /// How much of it may stay used [MiB], 0 to 1048576; 0: none is kept. KDD_ANSWERS_SIZE, folders/answerssize, "1024".
    static int answersSize();

    /// Whether servers must prove who they are when they are reached over TLS: not when the value is 0, so that a
    /// misspelt one errs on the safe side. KDD_TLS_VERIFY, tls/verify, "0".
    static bool verifiesTls();

    /// File with the certificates, in PEM, that such a proof may rest on. KDD_TLS_CA_FILE, tls/cafile, empty: those
    /// that the system trusts.
    static QByteArray tlsCaFile();

    /// Where pictures, videos and volume files are decoded, "apart" or "inside". KDD_DECODER, decoder/place, empty: as the
    /// program says, setDecoderPlace().
    static QByteArray decoder();

    /// How long whoever serves others tries to read a tag file that others hold [ms], 0 to 600000; 400 are tried in any
    /// case. A merge into the largest studies takes a second or two. KDD_READ_PATIENCE, tagfiles/readpatience, "2000".
    static int readPatience();

    /// How long a server of the image database is waited for, when it is to be reached or a search is to be answered [s], 2
    /// to 600. KDD_DATABASE_PATIENCE, database/patience, "20".
    static int databasePatience();

    /// The hosts that are told the session's id, separated by commas or blanks, with a port where only that one is
    /// meant. KDD_SESSION_HOSTS, web/sessionhosts, empty: all but the cloud storage and the places of tokens.
    static QByteArray sessionHosts();

    /// How long after the last arrival a study that was merged is built once more [s]. KDD_SETTLE_SECONDS,
    /// archive/settleseconds, "300".
    static int settleSeconds();

    /// Whether all threads use one set of connections, which libcurl does not support and which ends the process under
    /// load: only when the value is 1. KDD_SHARE_CONNECTIONS, web/shareconnections, "0".
    static bool sharesConnections();

    // Objects that arrive over a network.

    /// Folder of their files. KDD_OBJECTS, folders/objects, empty: "objects" in the store.
    static QByteArray objectsFolder();

    /// What becomes of one whose SOP Instance UID its study has with other content, "refuse" or "replace". KDD_SAME_UID,
    /// archive/sameuid, "refuse".
    static QByteArray sameUid();

    /// How much of the folder's disk stays free [MiB], up to 1,000,000,000. KDD_FREE_SPACE, archive/freespace, "1024".
    static int freeSpace();

    /// How large one may be [MiB], 1 to 1,048,576. KDD_OBJECT_SIZE, archive/objectsize, "4096".
    static int objectSize();

    /// Whether whoever registers a file keeps a digest of all its bytes: only when the value is 1. KDD_FILE_DIGESTS,
    /// archive/filedigests, "0".
    static bool takesFileDigests();

    // The look at all bytes of the archive in the background of `kdd serve`.

    /// How much it reads [MiB/s], up to 100,000; 0: there is none. KDD_CHECK_RATE, archive/checkrate, "0".
    static int checkRate();

    /// How long after a look at it a study is looked at again [h], up to 87,600. KDD_CHECK_HOURS, archive/checkhours, "168".
    static int checkHours();

    /// Whether tag files that are not those written last are built anew: only when the value is 1. KDD_CHECK_HEALS,
    /// archive/checkheals, "0".
    static bool checkHeals();

    // What `kdd serve` does when its options do not say it.

    /// Whether it takes objects: only when the value is 1. KDD_SERVER_STOW, server/stow, "0".
    static bool serverTakesObjects();

    /// Whether it takes corrections, and whether it deletes: only when the value is 1. KDD_SERVER_CORRECTIONS,
    /// server/corrections, "0"; KDD_SERVER_DELETIONS, server/deletions, "0".
    static bool serverTakesCorrections();
    static bool serverDeletes();

    /// Whether it holds each tag file that it reads against the image database, and serves none that is damaged: only when
    /// the value is 1. KDD_SERVER_PROVES, server/proves, "0".
    static bool serverProvesTagFiles();

    /// How large a request with objects may be [MiB], 1 to 16,777,216. KDD_SERVER_REQUEST_SIZE, server/requestsize, "65536".
    static int serverRequestSize();

    /// Where it waits for requests, ADDRESS:PORT. KDD_SERVER_LISTEN, server/listen, "127.0.0.1:8042".
    static QByteArray serverListen();

    /// Where it answers those who watch it, ADDRESS:PORT. KDD_SERVER_STATUS, server/status, empty: nowhere.
    static QByteArray serverStatus();

    /// Who may do what there: an access file, or "none" where everybody may do everything. KDD_SERVER_ACCESS,
    /// server/access, empty: everybody may, and only this machine reaches it.
    static QByteArray serverAccess();

    /// What the paths of DICOMweb begin with. KDD_SERVER_PREFIX, server/prefix, "/dicom-web".
    static QByteArray serverPrefix();

    /// Files with certificate and key, in PEM. KDD_SERVER_CERTIFICATE and KDD_SERVER_KEY, server/certificate and
    /// server/key, empty: no TLS.
    static QByteArray serverCertificate();
    static QByteArray serverKey();

    /// Folder of a viewer's files. KDD_SERVER_VIEWER, server/viewer, empty: no viewer.
    static QByteArray serverViewer();

    /// The address under which clients reach it. KDD_SERVER_PUBLIC, server/public, empty: the one that they ask.
    static QByteArray serverPublicAddress();

    /// Further names by which it may be asked, separated by commas or blanks. KDD_SERVER_HOSTS, server/hosts, empty.
    static QByteArray serverHosts();

    /// Numeric addresses of the proxies that may say how a client reached them, separated by commas or blanks.
    /// KDD_SERVER_PROXIES, server/proxies, empty.
    static QByteArray serverProxies();

    /// Threads that answer, up to 1,000. KDD_SERVER_THREADS, server/threads, "0": as many as suit the machine.
    static int serverThreads();

    /// Connections at a time, 1 to 1,000,000. KDD_SERVER_CONNECTIONS, server/connections, "10000".
    static int serverConnections();

    /// Requests that are answered or wait for a thread, 1 to 100,000. KDD_SERVER_REQUESTS, server/requests, "256".
    static int serverRequests();

    /// How long it waits for a request to come whole, and for a client to take more of an answer [s], 1 to 3,600.
    /// KDD_SERVER_PATIENCE, server/patience, "30".
    static int serverPatience();

    /// How long requests may go on when it stops [s], up to 3,600. KDD_SERVER_STOP, server/stop, "30".
    static int serverStop();

    /// Requests that take longer [ms] are told in the log. KDD_SERVER_SLOW, server/slow, "2000".
    static int serverSlow();

    // DICOM associations, in `kdd serve` and `kdd receive`.

    /// Where they are waited for, ADDRESS:PORT or a port of this machine alone. KDD_DICOM_LISTEN, dicom/listen, empty:
    /// nowhere.
    static QByteArray dicomListen();

    /// Application entity titles under which the server is called, separated by commas; "*": any. KDD_DICOM_TITLE,
    /// dicom/title, "KDD".
    static QByteArray dicomTitle();

    /// Who may have one, and for what: a peers file, or "none" where everybody may do everything. KDD_DICOM_PEERS,
    /// dicom/peers, empty: everybody may, and only this machine reaches it.
    static QByteArray dicomPeers();

    /// At a time, 1 to 1,000. KDD_DICOM_ASSOCIATIONS, dicom/associations, "64".
    static int dicomAssociations();

    /// How many answers one C-FIND gets, 1 to 100,000. KDD_DICOM_ANSWERS, dicom/answers, "10000".
    static int dicomAnswers();

    /// How long one may rest between two messages [s], 1 to 86,400. KDD_DICOM_IDLE, dicom/idle, "300".
    static int dicomIdle();
};

}  // namespace Kdd
