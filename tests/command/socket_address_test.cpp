#include "command/socket_address.h"

#include <algorithm>
#include <iterator>

#include <gtest/gtest.h>

using MARU::Backup::SocketAddress;

TEST(ASocketAddress, IsOfTheUnixFamilyAndHoldsThePathWithZerosBehindIt) {
    SocketAddress address;

    EXPECT_TRUE(address.setPath("/run/socket"));

    EXPECT_EQ(AF_UNIX, address.get()->sa_family);
    EXPECT_STREQ("/run/socket", address.un.sun_path);
    EXPECT_TRUE(std::all_of(address.un.sun_path + 11, std::end(address.un.sun_path), [](char c) { return c == 0; }));
}

TEST(ASocketAddress, IsAlways110BytesLong) {
    EXPECT_EQ(110U, +SocketAddress::SIZE);
}

TEST(ASocketAddress, HoldsPathsOfUpTo107Characters) {
    SocketAddress address;

    EXPECT_TRUE(address.setPath(""));
    EXPECT_TRUE(address.setPath(std::string(107, 'a')));
    EXPECT_FALSE(address.setPath(std::string(108, 'a')));
    EXPECT_FALSE(address.setPath(std::string(1 << 16, 'a')));
}
