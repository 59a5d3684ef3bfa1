#include "server/access/AuditMessages.h"

#include "server/Handled.h"
#include "server/http/Client.h"
#include "support/LogCapture.h"

#include <QTemporaryDir>
#include <QXmlStreamReader>

#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstring>

using namespace Kdd;
using namespace Kdd::Access;

namespace
{

/// What a receiver gets: by datagrams on a socket of the file system or of the network, or as a stream.
class Receiver
{
public:
    explicit Receiver(SyslogRules::By by)
    {
        rules.by = by;
        if (by == SyslogRules::By::Socket) {
            rules.host = mFolder.filePath(QStringLiteral("log")).toLocal8Bit();
            sockaddr_un address = {};
            address.sun_family = AF_UNIX;
            std::strcpy(address.sun_path, rules.host.constData());
            listen(AF_UNIX, SOCK_DGRAM, reinterpret_cast<const sockaddr*>(&address), sizeof address);
            return;
        }
        sockaddr_in address = {};
        socklen_t size = sizeof address;
        address.sin_family = AF_INET;
        address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        listen(AF_INET, by == SyslogRules::By::Udp ? SOCK_DGRAM : SOCK_STREAM,
               reinterpret_cast<const sockaddr*>(&address), sizeof address);
        ::getsockname(mSocket, reinterpret_cast<sockaddr*>(&address), &size);
        rules.host = by == SyslogRules::By::Tls ? "localhost" : "127.0.0.1";
        rules.port = QByteArray::number(ntohs(address.sin_port));
    }
    ~Receiver() { ::close(mSocket); }

    QByteArray datagram() const
    {
        QByteArray bytes(65536, '\0');
        bytes.truncate(
            static_cast<int>(::recv(mSocket, bytes.data(), static_cast<std::size_t>(bytes.size()), 0)));
        return bytes;
    }

    /// Of one TLS connection, up to its end. Empty when the sender does not trust us.
    QByteArray stream(const TlsFiles& files) const
    {
        const int connection = ::accept(mSocket, nullptr, nullptr);
        const std::unique_ptr<SSL_CTX, void (*)(SSL_CTX*)> context(SSL_CTX_new(TLS_server_method()),
                                                                   SSL_CTX_free);
        SSL_CTX_use_certificate_file(context.get(), files.certificate().constData(), SSL_FILETYPE_PEM);
        SSL_CTX_use_PrivateKey_file(context.get(), files.key().constData(), SSL_FILETYPE_PEM);
        const std::unique_ptr<SSL, void (*)(SSL*)> tls(SSL_new(context.get()), SSL_free);
        SSL_set_fd(tls.get(), connection);
        QByteArray all;
        QByteArray bytes(65536, '\0');
        for (int count = 1; SSL_accept(tls.get()) == 1 && count > 0;) {
            count = SSL_read(tls.get(), bytes.data(), bytes.size());
            all += bytes.left(std::max(0, count));
        }
        ::close(connection);
        return all;
    }

    SyslogRules rules;

private:
    void listen(int family, int type, const sockaddr* address, socklen_t size)
    {
        mSocket = ::socket(family, type | SOCK_CLOEXEC, 0);
        ASSERT_EQ(::bind(mSocket, address, size), 0);
        ASSERT_TRUE(type == SOCK_DGRAM || ::listen(mSocket, 5) == 0);
    }

    QTemporaryDir mFolder;
    int mSocket = -1;
};

Http::Exchange anExchange(Http::Method method, const char* path, int status = 200)
{
    Http::Exchange exchange;
    exchange.request = requestFor(path, {}, method);
    exchange.request.query = {{"PatientName", "Doe"}, {"code", "secret"}};
    exchange.request.peer = "10.0.0.7";
    exchange.caller = "anna<\"&\x01";
    exchange.status = status;
    return exchange;
}

/// "110104 C 0 anna 1.2": event, what is done, outcome, who, of which study; of each message.
std::string told(const Http::Exchange& exchange)
{
    QStringList all;
    const Asked asked = RightsTable({"dicom-web"}).find(exchange.request);
    for (const QByteArray& message :
         AuditMessages::messagesOf(exchange, asked, "2026-01-01T00:00:00Z", "host")) {
        QXmlStreamReader xml(message);
        QStringList words;
        const auto add = [&](const char* name) {
            if (xml.attributes().hasAttribute(QLatin1String(name)))
                words << xml.attributes().value(QLatin1String(name)).toString();
        };
        while (!xml.atEnd()) {
            if (xml.readNext() != QXmlStreamReader::StartElement)
                continue;
            add("EventActionCode");
            add("EventOutcomeIndicator");
            if (xml.name().startsWith(QLatin1String("Event")))
                add("csd-code");
            if (xml.attributes().value(QLatin1String("UserIsRequestor")) == QLatin1String("true"))
                add("UserID");
            add("ParticipantObjectID");
        }
        EXPECT_FALSE(xml.hasError()) << message.constData();
        EXPECT_FALSE(message.contains("Doe") || message.contains("secret")) << message.constData();
        all << words.join(QLatin1Char(' '));
    }
    return all.join(QLatin1Char('\n')).toStdString();
}

TEST(AuditMessagesTest, NameTheEventByWhatIsDone)
{
    const auto kGet = Http::Method::Get;
    const auto kPost = Http::Method::Post;
    const auto kDelete = Http::Method::Delete;
    const std::tuple<Http::Method, const char*, int, const char*> kExchanges[] = {
        {kGet, "dicom-web/studies", 200, "E 0 110112 anna<\"&"},
        {kGet, "dicom-web/studies/1.2/series/1.3/instances/1.4/frames/1", 200, "R 0 110104 anna<\"& 1.2"},
        {kGet, "dicom-web/studies/1.2/metadata", 403, "R 4 110103 anna<\"& 1.2"},
        {kGet, "browser/studies/1.2/series/1.3/images", 500, "R 8 110103 anna<\"& 1.2"},
        {kPost, "dicom-web/studies/1.2/corrections", 200, "U 0 110103 anna<\"& 1.2"},
        {kDelete, "dicom-web/studies/1.2", 200, "D 0 110105 anna<\"& 1.2"},
        {kDelete, "dicom-web/studies/1.2/series/1.3", 200, "D 0 110103 anna<\"& 1.2"},
        {kGet, "signin/callback", 303, "E 0 110114 110122 anna<\"&"},
        {kPost, "signout", 200, "E 0 110114 110123 anna<\"&"},
        {kGet, "signin", 303, ""},
        {kGet, "page/app.js", 200, ""},
        {kGet, "browser/config", 200, ""},
        {Http::Method::Options, "dicom-web/studies", 204, ""},
    };
    for (const auto& [method, path, status, expected] : kExchanges)
        EXPECT_EQ(told(anExchange(method, path, status)), expected) << path;
    Http::Exchange stored = anExchange(kPost, "dicom-web/studies");
    stored.effect = Http::Effect{{"1.2", "5"}, 2};
    EXPECT_EQ(told(stored), "C 0 110104 anna<\"& 1.2\nC 0 110104 anna<\"& 5");
    stored.caller.clear();
    stored.effect.reset();
    EXPECT_EQ(told(stored), "C 0 110104 unknown@10.0.0.7");
}

TEST(AuditMessagesTest, ComeAsSyslogHasThem)
{
    for (const SyslogRules::By by : {SyslogRules::By::Udp, SyslogRules::By::Socket}) {
        const Receiver receiver(by);
        {
            AuditMessages messages(receiver.rules, RightsTable({"dicom-web"}));
            for (int i = 0; i < 3; ++i)
                messages.ended(anExchange(Http::Method::Get, "dicom-web/studies/1.2/metadata"));
        }
        for (const char* code : {"110120", "110103", "110121"}) {
            const QByteArray message = receiver.datagram();
            EXPECT_TRUE(message.startsWith("<85>1 2")) << message.constData();
            EXPECT_TRUE(message.contains(" DICOM+RFC3881 - \xEF\xBB\xBF<?xml "));
            EXPECT_TRUE(message.contains(code)) << "once, and in order: " << message.constData();
        }
    }
}

TEST(AuditMessagesTest, GoToAReceiverThatProvesWhoItIs)
{
    const LogCapture log;
    const TlsFiles files;
    const TlsFiles other;
    for (const TlsFiles* trusted : {&files, &other}) {
        Receiver receiver(SyslogRules::By::Tls);
        receiver.rules.caFile = trusted->certificate();
        auto sender = std::make_unique<SyslogSender>(receiver.rules);
        sender->send("one");
        sender->send("<two>");
        std::thread end([&] { sender.reset(); });
        EXPECT_EQ(receiver.stream(files), trusted == &files ? "3 one5 <two>" : "");
        // It tries once more.
        if (trusted == &other) {
            EXPECT_EQ(receiver.stream(files), "");
        }
        end.join();
    }
    EXPECT_EQ(log.count("Audit messages do not reach localhost: "), 1);
    EXPECT_EQ(log.count("2 audit messages were lost"), 1);
}

TEST(AuditMessagesTest, NeverHoldAnybodyUp)
{
    const LogCapture log;
    SyslogRules rules;
    rules.by = SyslogRules::By::Socket;
    rules.host = "/none/none/log";
    {
        SyslogSender sender(rules);
        for (int i = 0; i < 10100; ++i)
            sender.send("message");
    }
    EXPECT_EQ(log.count("Audit messages do not reach /none/none/log"), 1);
    EXPECT_EQ(log.count("10100 audit messages were lost"), 1);
}

}  // namespace
