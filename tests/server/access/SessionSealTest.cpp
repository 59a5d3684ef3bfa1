#include "server/access/SessionSeal.h"

#include "server/access/SignInProvider.h"
#include "support/FileContent.h"

#include <gtest/gtest.h>

using namespace Kdd;
using namespace Kdd::Access;

namespace
{

using Purpose = SessionSeal::Purpose;

const QByteArray kOld = QByteArray(64, 'a');
const QByteArray kNew = QByteArray(64, 'b');

SessionSeal sealWith(const QByteArray& keys)
{
    SessionSeal seal;
    EXPECT_EQ(SessionSeal::parse(keys, seal).text(), QString());
    return seal;
}

bool opens(const SessionSeal& seal, const QByteArray& sealed, Purpose purpose = Purpose::Session)
{
    QByteArray text;
    return seal.open(purpose, sealed, text) && text == "anna";
}

TEST(SessionSeal, OpensWhatItSealedAndNothingElse)
{
    const SessionSeal seal = sealWith(kOld);
    const QByteArray sealed = seal.seal(Purpose::Session, "anna");
    EXPECT_TRUE(opens(seal, sealed));
    EXPECT_NE(seal.seal(Purpose::Session, "anna"), sealed) << "each has a nonce of its own";
    EXPECT_FALSE(opens(seal, sealed, Purpose::SigningIn));
    EXPECT_FALSE(opens(sealWith(kNew), sealed));
    for (int i = 0; i < sealed.size(); ++i) {
        QByteArray damaged = sealed;
        damaged[i] = damaged[i] == 'A' ? 'B' : 'A';
        EXPECT_FALSE(opens(seal, damaged)) << i;
        EXPECT_FALSE(opens(seal, sealed.left(i))) << i;
    }
    EXPECT_FALSE(opens(seal, sealed + "="));
    EXPECT_FALSE(opens(seal, QByteArray(5000, 'A')));
    EXPECT_TRUE(seal.seal(Purpose::Session, QByteArray(3000, 'x')).isNull()) << "no browser would keep it";
    EXPECT_TRUE(SessionSeal().seal(Purpose::Session, "anna").isNull());
}

TEST(SessionSeal, ChangesItsKeysWithoutLosingSessions)
{
    const QByteArray former = sealWith(kOld).seal(Purpose::Session, "anna");
    const SessionSeal both = sealWith("# of today\n" + kNew + "\r\n\n" + kOld.toUpper() + '\n');
    EXPECT_TRUE(opens(both, former));
    EXPECT_TRUE(opens(sealWith(kNew), both.seal(Purpose::Session, "anna")));
    EXPECT_FALSE(opens(sealWith(kNew), former));
}

TEST(SessionSeal, TakesNoKeysThatAreNone)
{
    SessionSeal seal;
    for (const QByteArray& text : {QByteArray(), QByteArray("#\n"), QByteArray(62, 'a'), QByteArray(66, 'a'),
                                   QByteArray(64, 'g'), (kOld + '\n').repeated(11)})
        EXPECT_TRUE(SessionSeal::parse(text, seal).bad()) << text.constData();
    const QTemporaryDir folder;
    const QString path = folder.filePath(QStringLiteral("keys"));
    putFile(path, kOld);
    QFile::setPermissions(path, QFile::ReadOwner | QFile::ReadOther);
    EXPECT_TRUE(SessionSeal::read(path, seal).text().contains(QLatin1String("everybody")));
}

TEST(ProviderAddressesTest, AreOfTheIssuerAndEncrypted)
{
    const QByteArray good = R"({"issuer":"i","authorization_endpoint":"https://a.example/b?c=d",)";
    const std::pair<QByteArray, bool> kTexts[] = {
        {good + R"("token_endpoint":"https://a.example/t"})", true},
        {good + R"("token_endpoint":"http://127.0.0.1:80/t"})", true},
        {good + R"("token_endpoint":"http://a.example/t"})", false},
        {good + R"("token_endpoint":"https://a.example/t","token_endpoint":"https://b.example/t"})", false},
        {good + R"("token_endpoint":"https://a.example/t\r\nX: y"})", false},
        {good + R"("token_endpoint":"https:///t"})", false},
        {good + R"("token_endpoint":"javascript:alert"})", false},
        {good + R"("token_endpoint":7})", false},
        {good + "}", false},
        {R"({"issuer":"j","authorization_endpoint":"https://a","token_endpoint":"https://a"})", false},
        {"[]", false},
        {"", false},
    };
    for (const auto& [text, isGood] : kTexts) {
        ProviderAddresses addresses;
        EXPECT_EQ(ProviderAddresses::parse(text, QStringLiteral("i"), addresses).good(), isGood)
            << text.constData();
        EXPECT_EQ(addresses.token.isEmpty(), !isGood);
    }
}

}  // namespace
