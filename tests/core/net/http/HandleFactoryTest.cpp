#include "kddlib/net/http/KxCurlHandleFactory.h"

#include <gtest/gtest.h>

using namespace Kdd;

namespace
{

TEST(HandleFactory, KeepsTheHandlesGivenBackLast)
{
    KxCurlHandleFactory factory(3);
    CurlEasy handles[] = {factory.takeEasy(), factory.takeEasy(), factory.takeEasy(), factory.takeEasy()};
    const CURL* const names[] = {handles[0].get(), handles[1].get(), handles[2].get(), handles[3].get()};
    for (CurlEasy& handle : handles)
        factory.giveBack(std::move(handle));
    for (size_t i = 3; i > 0; --i) {
        handles[i] = factory.takeEasy();
        EXPECT_EQ(handles[i].get(), names[i]);
    }
}

TEST(HandleFactory, ForgetsTheOptionsOfAnEasyHandleAtOnce)
{
    KxCurlHandleFactory factory(1);
    CurlEasy handle = factory.takeEasy();
    CURL* const name = handle.get();
    curl_easy_setopt(name, CURLOPT_PRIVATE, name);
    factory.giveBack(std::move(handle));
    void* kept = name;
    curl_easy_getinfo(name, CURLINFO_PRIVATE, &kept);
    EXPECT_EQ(kept, nullptr);
}

TEST(HandleFactory, TakesMultiHandlesFromThePoolOnlyWhileEasyOnesAreIdle)
{
    KxCurlHandleFactory factory(2);
    factory.giveBack(factory.takeEasy());
    CurlMulti first = factory.takeMulti();  // of an empty pool
    ASSERT_NE(first, nullptr);
    CURLM* const name = first.get();
    factory.giveBack(std::move(first));
    const CurlEasy inUse = factory.takeEasy();
    const CurlMulti second = factory.takeMulti();
    EXPECT_NE(second.get(), name);
    factory.giveBack(factory.takeEasy());
    EXPECT_EQ(factory.takeMulti().get(), name);
}

TEST(HandleFactory, LeavesEnoughConnectionsOpenForAllThatShareThem)
{
    EXPECT_EQ(KxCurlHandleFactory(48).connectionLimit(), 8);
    KxCurlHandleFactory factory(2, CurlShare::Connections::Shared);
    std::vector<CurlEasy> inUse;
    for (int i = 0; i < 70; ++i)
        inUse.push_back(factory.takeEasy());
    EXPECT_GT(factory.connectionLimit(), 70);
    for (CurlEasy& handle : inUse)
        factory.giveBack(std::move(handle));
    EXPECT_EQ(factory.connectionLimit(), 8);
}

}  // namespace
