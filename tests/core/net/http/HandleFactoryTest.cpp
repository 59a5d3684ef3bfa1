#include "kddlib/net/http/KxCurlHandleFactory.h"

#include <gtest/gtest.h>

using namespace Kdd;

namespace
{

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
