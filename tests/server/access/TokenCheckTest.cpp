#include "server/access/TokenCheck.h"

#include "server/access/TokenIssuer.h"
#include "support/HttpServer.h"
#include "support/LogCapture.h"

#include <gtest/gtest.h>

#include <atomic>

using namespace Kdd;
using namespace Kdd::Access;

namespace
{

const TokenIssuer& issuer()
{
    static const TokenIssuer made;
    return made;
}

TokenRules rules()
{
    TokenRules made;
    made.issuer = QStringLiteral("https://login.example");
    made.audiences = {QStringLiteral("other"), QStringLiteral("archive")};
    made.rights = {{QStringLiteral("scope"), QStringLiteral("images.read"), Right::Read},
                   {QStringLiteral("realm.roles"), QStringLiteral("qa"), Right::Correct}};
    return made;
}

class TokenCheckTest : public testing::Test
{
protected:
    std::string check(const QByteArray& token)
    {
        const TokenCheck::Verdict verdict = mCheck.check(token);
        if (verdict.isUndecidable)
            return "undecidable";
        return verdict.fault.isEmpty() ? (verdict.caller.subject + ' ' +
                                          QByteArray::number(static_cast<int>(verdict.caller.rights)))
                                             .toStdString()
                                       : verdict.fault.toStdString();
    }

    Result fetch(QByteArray& text)
    {
        ++mFetched;
        if (mKeySet.isEmpty())
            return Result::failure(QStringLiteral("nobody answers"));
        text = mKeySet;
        return {};
    }

    LogCapture mLog;
    QByteArray mKeySet = issuer().keySet();
    int mFetched = 0;
    std::chrono::seconds mNow{kNow};
    TokenCheck mCheck{rules(), [this](QByteArray& text) { return fetch(text); }, [this] { return mNow; }};
};

TEST_F(TokenCheckTest, TakesWhatTheIssuerSigned)
{
    const QByteArray body = TokenIssuer::text(TokenIssuer::claims());
    EXPECT_EQ(check(issuer().token()), "anna 1");
    EXPECT_EQ(check(issuer().signedByEc(TokenIssuer::header("ES256", "ec"), body)), "anna 1");
    // The only key that signs so needs no name.
    EXPECT_EQ(check(issuer().signedByEc(R"({"alg":"ES256"})", body)), "anna 1");
    EXPECT_EQ(check(issuer().token(TokenIssuer::claimsWith("aud", QJsonArray{QStringLiteral("archive")}))),
              "anna 1");
    EXPECT_EQ(check(issuer().token(TokenIssuer::claimsWith("exp", kNow - 59))), "anna 1");
    EXPECT_EQ(check(issuer().token(TokenIssuer::claimsWith("nbf", kNow + 60))), "anna 1");
}

TEST_F(TokenCheckTest, GivesWhatTheClaimsSay)
{
    const std::tuple<const char*, QJsonValue, const char*> kClaims[] = {
        {"scope", QStringLiteral("images.reader"), "anna 0"},
        {"scope", QStringLiteral("images.*"), "anna 0"},
        {"scope", QJsonArray{QStringLiteral("x"), QStringLiteral("images.read")}, "anna 1"},
        {"scope", QJsonArray{QStringLiteral("x images.read")}, "anna 0"},
        {"scope", true, "anna 0"},
        {"realm", QJsonObject{{QStringLiteral("roles"), QJsonArray{QStringLiteral("qa")}}}, "anna 5"},
        {"realm.roles", QStringLiteral("qa"), "anna 5"},
        {"realm", QStringLiteral("qa"), "anna 1"},
    };
    for (const auto& [name, value, verdict] : kClaims)
        EXPECT_EQ(check(issuer().token(TokenIssuer::claimsWith(name, value))), verdict) << name;
}

/// By name, and what is said of each.
std::vector<std::tuple<const char*, QByteArray, const char*>> badTokens()
{
    const auto with = [](const char* name, const QJsonValue& value) {
        return issuer().token(TokenIssuer::claimsWith(name, value));
    };
    const auto headed = [](const QByteArray& header) {
        return issuer().signedByRsa(header, TokenIssuer::text(TokenIssuer::claims()));
    };
    const auto saying = [](const QByteArray& claims) {
        return issuer().signedByRsa(TokenIssuer::header(), claims);
    };
    static const TokenIssuer other;
    const QByteArray body = TokenIssuer::text(TokenIssuer::claims());
    const QByteArray good = issuer().token();
    const QByteArray none = base64Url(R"({"alg":"none"})") + '.' + base64Url(body) + '.';
    QJsonObject nobody = TokenIssuer::claims();
    nobody.remove(QStringLiteral("sub"));
    QJsonObject endless = TokenIssuer::claims();
    endless.remove(QStringLiteral("exp"));
    const char* const unreadable = "The token cannot be read";
    const char* const unknown = "The key of the token is not known";
    const char* const forged = "The signature of the token is not good";
    const char* const timeless = "The token does not say from when to when it is good";
    return {
        {"Expired", with("exp", kNow - 60), "The token has expired"},
        {"NotYet", with("nbf", kNow + 61), "The token is not good yet"},
        {"IssuedLater", with("iat", kNow + 61), "The token is not good yet"},
        {"OtherIssuer", with("iss", QStringLiteral("https://login.example/")),
         "The token is of another issuer"},
        {"NoIssuer", with("iss", QJsonValue::Null), "The token is of another issuer"},
        {"OtherAudience", with("aud", QStringLiteral("archives")), "The token is meant for others"},
        {"OtherAudiences", with("aud", QJsonArray{QStringLiteral("x"), 1}), "The token is meant for others"},
        {"AudienceIsANumber", with("aud", 1), "The token is meant for others"},
        {"ForEver", issuer().token(endless), timeless},
        {"ExpiryIsAText", with("exp", QStringLiteral("1900000000")), timeless},
        {"ExpiryIsFar", with("exp", 1e300), timeless},
        {"BeginIsNegative", with("nbf", -1), timeless},
        {"NobodysName", issuer().token(nobody), "The token names nobody"},
        {"NameIsAList", with("sub", QJsonArray{QStringLiteral("anna")}), "The token names nobody"},
        {"NameIsLong", with("sub", QString(257, QLatin1Char('x'))), "The token names nobody"},
        {"NotSigned", none, unreadable},
        {"NotSignedButSomething", none + "AAAA", unreadable},
        {"NotSignedWithRsa", headed(R"({"alg":"none","kid":"rsa"})"), unreadable},
        {"SignedWithThePublicKey", issuer().signedByPublicKey(TokenIssuer::header("HS256"), body),
         unreadable},
        {"PublicKeyUnderRsasName", issuer().signedByPublicKey(TokenIssuer::header(), body), forged},
        {"OtherWayOfRsa", headed(TokenIssuer::header("PS256")), unreadable},
        {"SmallLetters", headed(TokenIssuer::header("rs256")), unreadable},
        {"OtherKeysName", headed(TokenIssuer::header("RS256", "nobody")), unknown},
        {"OtherTypesKey", headed(TokenIssuer::header("RS256", "ec")), unknown},
        {"OtherTypesSignature", headed(TokenIssuer::header("ES256", "ec")), forged},
        {"OtherIssuersKey", other.token(), forged},
        {"OtherText",
         good.left(good.indexOf('.')) + '.' + base64Url(TokenIssuer::text(endless)) +
             good.mid(good.lastIndexOf('.')),
         forged},
        {"WantsToBeUnderstood", headed(R"({"alg":"RS256","kid":"rsa","crit":["x"],"x":1})"), unreadable},
        {"ForLoggingOut", headed(R"({"alg":"RS256","kid":"rsa","typ":"logout+jwt"})"), unreadable},
        {"KeyNameIsLong", headed(TokenIssuer::header("RS256", QByteArray(257, 'x').constData())), unreadable},
        {"Long", with("more", QString(13 * 1024, QLatin1Char('x'))), unreadable},
        {"KeyNameIsANumber", headed(R"({"alg":"RS256","kid":1})"), unreadable},
        {"HeaderSaidTwice", headed(R"({"alg":"none","alg":"RS256","kid":"rsa"})"), unreadable},
        {"ClaimSaidTwice", saying(R"({"sub":"anna",)" + body.mid(1)), unreadable},
        {"ClaimSaidTwiceOtherwise", saying(R"({"s\u0075b":"anna",)" + body.mid(1)), unreadable},
        {"ClaimsAreAList", saying('[' + body + ']'), unreadable},
        {"ClaimsAreNoJson", saying(body + 'x'), unreadable},
        {"Padded", good.left(good.indexOf('.')) + '=' + good.mid(good.indexOf('.')), unreadable},
        {"OtherAlphabet", QByteArray(good).replace('-', '+').replace('_', '/') + '+', unreadable},
        {"Blank", good.left(9) + ' ' + good.mid(9), unreadable},
        {"FourParts", good + ".AAAA", unreadable},
        {"Empty", "", unreadable},
        {"Points", "..", unreadable},
        {"Huge", good.left(good.indexOf('.')) + '.' + base64Url(QByteArray(13000, ' ')) + ".AAAA",
         unreadable},
    };
}

TEST_F(TokenCheckTest, TakesNothingElse)
{
    for (const auto& [name, token, fault] : badTokens())
        EXPECT_EQ(check(token), fault) << name;
    EXPECT_EQ(mLog.count("anna"), 0);
}

TEST_F(TokenCheckTest, TakesNoTokenThatIsCutOrChangedAnywhere)
{
    const QByteArray good = issuer().token();
    for (int i = 0; i < good.size(); ++i) {
        QByteArray changed = good;
        changed[i] = changed[i] == 'A' ? 'B' : 'A';
        EXPECT_EQ(check(good.left(i)).rfind("The ", 0), 0U) << i;
        EXPECT_EQ(check(changed).rfind("The ", 0), 0U) << i;
    }
    EXPECT_EQ(check(good), "anna 1");
}

TEST_F(TokenCheckTest, ForgetsATokenThatWasGood)
{
    const QByteArray token = issuer().token();
    EXPECT_EQ(check(token), "anna 1");
    mNow = std::chrono::seconds(kNow + 359);
    EXPECT_EQ(check(token), "anna 1");
    mNow = std::chrono::seconds(kNow + 360);
    EXPECT_EQ(check(token), "The token has expired");
}

TEST_F(TokenCheckTest, FollowsWhenKeysAreChanged)
{
    const TokenIssuer next;
    const QByteArray former = issuer().token(TokenIssuer::claimsWith("exp", kNow + 100000));
    const QByteArray later =
        next.signedByRsa(TokenIssuer::header("RS256", "next"),
                         TokenIssuer::text(TokenIssuer::claimsWith("exp", kNow + 100000)));
    EXPECT_EQ(check(former), "anna 1");
    mKeySet = TokenIssuer::keySet({next.rsaKey("next")});
    mNow += std::chrono::seconds(9);
    // Not asked again at once: names of keys can be made up.
    EXPECT_EQ(check(later), "The key of the token is not known");
    EXPECT_EQ(mFetched, 1);
    mNow += std::chrono::seconds(1);
    EXPECT_EQ(check(later), "anna 1");
    EXPECT_EQ(check(former), "The key of the token is not known");
    EXPECT_EQ(mFetched, 2);
}

TEST_F(TokenCheckTest, LetsATokenGoWithItsKeyWhenKeysAreOld)
{
    const QByteArray token = issuer().token(TokenIssuer::claimsWith("exp", kNow + 100000));
    EXPECT_EQ(check(token), "anna 1");
    mKeySet = TokenIssuer::keySet({issuer().ecKey()});
    mNow += std::chrono::seconds(3599);
    EXPECT_EQ(check(token), "anna 1");
    mNow += std::chrono::seconds(1);
    EXPECT_EQ(check(token), "The key of the token is not known");
}

TEST_F(TokenCheckTest, GoesOnForATimeWithoutTheProvider)
{
    const QByteArray token = issuer().token(TokenIssuer::claimsWith("exp", kNow + 400000));
    for (const QByteArray& nothing : {QByteArray(), QByteArray("<html>"), QByteArray(R"({"keys":[]})")}) {
        EXPECT_EQ(check(token), "anna 1");
        mKeySet = nothing;
        mNow += std::chrono::seconds(86399);
        EXPECT_EQ(check(token), "anna 1");
        mNow += std::chrono::seconds(1);
        EXPECT_EQ(check(token), "undecidable");
        mKeySet = issuer().keySet();
        mNow += std::chrono::seconds(10);
    }
    EXPECT_GE(mLog.count("The keys that tokens are signed with cannot be had: "), 3);
}

TEST_F(TokenCheckTest, KnowsNoTokenWithoutKeys)
{
    mKeySet.clear();
    EXPECT_EQ(check(issuer().token()), "undecidable");
    EXPECT_EQ(check("nonsense"), "undecidable");
    EXPECT_EQ(mFetched, 1);
}

TEST(TokenKeys, AreOnlyThoseThatSignWell)
{
    const auto changed = [](QJsonObject key, const char* name, const QJsonValue& value) {
        key.insert(QLatin1String(name), value);
        return key;
    };
    const QJsonObject rsa = issuer().rsaKey();
    const QJsonObject ec = issuer().ecKey();
    const QString shortOne = rsa.value(QLatin1String("n")).toString().left(338);
    const QJsonObject kKeys[] = {
        changed(rsa, "use", QStringLiteral("enc")),
        changed(rsa, "alg", QStringLiteral("PS256")),
        changed(rsa, "key_ops", QJsonArray{QStringLiteral("encrypt")}),
        changed(rsa, "n", shortOne),
        changed(rsa, "n", rsa.value(QLatin1String("n")).toString() + QLatin1Char('=')),
        changed(rsa, "e", QStringLiteral("AQ")),
        changed(rsa, "e", QStringLiteral("AAAA")),
        changed(rsa, "kty", QStringLiteral("oct")),
        changed(ec, "crv", QStringLiteral("P-384")),
        changed(ec, "x", ec.value(QLatin1String("y"))),
        changed(ec, "y", QStringLiteral("AAAA")),
    };
    Result result;
    for (const QJsonObject& key : kKeys) {
        EXPECT_EQ(TokenKeys::read(TokenIssuer::keySet({key}), result), nullptr)
            << TokenIssuer::text(key).toStdString();
        EXPECT_EQ(result.text(), QStringLiteral("it has no key for RS256 or ES256"));
    }
    // What stands behind the hundredth is not looked at.
    QJsonArray many;
    for (int i = 0; i < 100; ++i)
        many.append(changed(ec, "kid", QString::number(i)));
    many.append(rsa);
    const QByteArray set = QJsonDocument(QJsonObject{{QStringLiteral("keys"), many}}).toJson();
    const auto keys = TokenKeys::read(set, result);
    ASSERT_NE(keys, nullptr);
    EXPECT_TRUE(keys->has("99", Algorithm::ES256));
    EXPECT_FALSE(keys->has("rsa", Algorithm::RS256));
    // Of two by one name nobody knows which is meant.
    EXPECT_FALSE(TokenKeys::read(TokenIssuer::keySet({rsa, rsa}), result)->has("rsa", Algorithm::RS256));
}

TEST(ProviderKeys, AreFetchedFromAServer)
{
    std::atomic<bool> isDown{false};
    const ScriptedServer server([&](const QByteArray&) {
        return ScriptedServer::Reply{isDown ? httpResponse("", "500 Broken")
                                            : httpResponse(issuer().keySet())};
    });
    TokenRules withAddress = rules();
    withAddress.keys = QByteArray::fromStdString(server.url("certs"));
    std::chrono::seconds now{kNow};
    TokenCheck check(withAddress, ProviderKeys::fetchOf(withAddress), [&] { return now; });
    EXPECT_EQ(check.check(issuer().token()).caller.subject, "anna");
    isDown = true;
    now += std::chrono::seconds(86400);
    LogCapture log;
    EXPECT_TRUE(check.check(issuer().token()).isUndecidable);
    EXPECT_EQ(log.count("HTTP response code 500"), 1);
    EXPECT_EQ(server.requests().size(), 2U);
}

TEST(ProviderKeys, ComeFromWhomTheyAreSaidToComeFrom)
{
    const NginxServer server(NginxServer::Scheme::Https);
    server.addFile("certs", issuer().keySet());
    LogCapture log;
    TokenRules withAddress = rules();
    withAddress.keys = QByteArray::fromStdString(server.url("certs"));
    QByteArray text;
    EXPECT_TRUE(ProviderKeys::fetchOf(withAddress)(text).bad());
    EXPECT_EQ(text, "");
    withAddress.caFile = server.certificateFile();
    EXPECT_EQ(ProviderKeys::fetchOf(withAddress)(text).text(), QString());
    EXPECT_EQ(text, issuer().keySet());
}

}  // namespace
