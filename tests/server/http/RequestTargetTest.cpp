#include "server/http/RequestTarget.h"

#include <QByteArrayList>

#include <gtest/gtest.h>

using namespace Kdd;
using Http::RequestTarget;

namespace
{

/// "host|segment/segment|name=value&name=value", or "refused".
std::string partsOf(const QByteArray& target)
{
    RequestTarget parsed;
    if (!RequestTarget::parse(target, parsed))
        return parsed.path.isEmpty() && parsed.query.isEmpty() && parsed.authority.isNull() ? "refused"
                                                                                            : "left";
    QByteArrayList query;
    for (const Http::Field& field : parsed.query)
        query.append(field.name + '=' + field.value);
    return (parsed.authority + '|' + QByteArrayList(parsed.path.toList()).join('/') + '|' + query.join('&'))
        .toStdString();
}

TEST(RequestTarget, IsTakenApartAndDecoded)
{
    const std::pair<const char*, const char*> kTargets[] = {
        {"/", "||"},
        {"*", "||"},
        {"/dicom-web/studies?limit=5&limit=6", "|dicom-web/studies|limit=5&limit=6"},
        {"//studies/", "|studies|"},
        {"/a%20b/%C3%A4+c", "|a b/\xC3\xA4+c|"},
        {"/a?PatientName=Doe+J%2B%5E*&&x&=y", "|a|PatientName=Doe J+^*&x=&=y"},
        {"/a?accept=application/dicom+json", "|a|accept=application/dicom+json"},
        {"/a?b=c?d=e", "|a|b=c?d=e"},
        {"HTTP://localhost:80/a?b", "localhost:80|a|b="},
        {"https://[::1]", "[::1]||"},
        {"/...", "|...|"},
    };
    for (const auto& [target, parts] : kTargets)
        EXPECT_EQ(partsOf(target), parts) << target;
}

TEST(RequestTarget, ThatClimbsOrCannotBeDecodedIsRefused)
{
    for (const char* target :
         {"",        "a/b",      "/.",           "/..",       "/a/../b", "/%2e%2E/etc", "/a%2Fb",
          "/a%00b",  "/a?b=%00", "/%",           "/%4",       "/%g0",    "/%4g",        "/a?%=b",
          "/a?b=%2", "/a#b",     "ftp://host/a", "http:///a", "http:/a", "mailto:a"})
        EXPECT_EQ(partsOf(target), "refused") << target;
}

TEST(RequestTarget, WithMorePartsThanAnyoneNeedsIsRefused)
{
    EXPECT_NE(partsOf(QByteArray("/a").repeated(64)), "refused");
    EXPECT_EQ(partsOf(QByteArray("/a").repeated(65)), "refused");
    EXPECT_NE(partsOf("/?" + QByteArray("a&").repeated(1000)), "refused");
    EXPECT_EQ(partsOf("/?" + QByteArray("a&").repeated(1001)), "refused");
}

}  // namespace
