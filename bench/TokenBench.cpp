// What it costs to know who asks.

#include "server/access/TokenCheck.h"
#include "server/access/TokenIssuer.h"

#include <benchmark/benchmark.h>

using namespace Kdd;
using namespace Kdd::Access;

namespace
{

TokenRules rules()
{
    TokenRules made;
    made.issuer = QStringLiteral("https://login.example");
    made.audiences = {QStringLiteral("archive")};
    made.rights = {{QStringLiteral("scope"), QStringLiteral("images.read"), Right::Read}};
    return made;
}

constexpr int kTokens = 64;

/// Of so many users, whose names make the tokens differ.
template <typename Sign>
std::vector<QByteArray> tokensOf(const Sign& sign)
{
    std::vector<QByteArray> tokens;
    for (int i = 0; i < kTokens; ++i) {
        QJsonObject claims = TokenIssuer::claimsWith("sub", QString::number(i));
        tokens.push_back(sign(TokenIssuer::text(claims)));
    }
    return tokens;
}

/// One token after the other: each for the first time, or each seen before.
void check(benchmark::State& state, const TokenIssuer& issuer, const std::vector<QByteArray>& tokens)
{
    const QByteArray keys = issuer.keySet();
    const bool isKnown = state.range(0) != 0;
    std::unique_ptr<TokenCheck> checked;
    std::size_t next = tokens.size();
    for (auto each : state) {
        if (next == tokens.size() && (checked == nullptr || !isKnown)) {
            state.PauseTiming();
            checked = std::make_unique<TokenCheck>(
                rules(),
                [&](QByteArray& text) {
                    text = keys;
                    return Result();
                },
                [] { return std::chrono::seconds(kNow); });
            checked->check("none");
            for (const QByteArray& token : tokens)
                if (isKnown)
                    checked->check(token);
            state.ResumeTiming();
        }
        next = next == tokens.size() ? 0 : next;
        if (!checked->check(tokens[next++]).fault.isEmpty())
            state.SkipWithError("the token is refused");
    }
}

void checkRsa(benchmark::State& state)
{
    static const TokenIssuer issuer;
    static const std::vector<QByteArray> tokens =
        tokensOf([&](const QByteArray& claims) { return issuer.signedByRsa(TokenIssuer::header(), claims); });
    check(state, issuer, tokens);
}
BENCHMARK(checkRsa)->ArgName("known")->Arg(1)->Arg(0);

void checkCurve(benchmark::State& state)
{
    static const TokenIssuer issuer;
    static const std::vector<QByteArray> tokens = tokensOf([&](const QByteArray& claims) {
        return issuer.signedByEc(TokenIssuer::header("ES256", "ec"), claims);
    });
    check(state, issuer, tokens);
}
BENCHMARK(checkCurve)->ArgName("known")->Arg(1)->Arg(0);

}  // namespace

BENCHMARK_MAIN();
