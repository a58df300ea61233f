#include "platform/dbus/Address.h"

#include <cerrno>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela::platform::dbus {
namespace {

using ::testing::ElementsAre;

std::vector<SocketAddress> parsed(std::string_view address) {
    const auto addresses = parseAddress(address);
    EXPECT_TRUE(addresses) << address;
    return addresses ? *addresses : std::vector<SocketAddress>();
}
std::string faultOf(std::string_view address) {
    const auto addresses = parseAddress(address);
    return addresses ? "no fault" : addresses.failure().description;
}

TEST(AddressTest, PathsAndAbstractNamesAreRead) {
    EXPECT_THAT(parsed("unix:path=/run/vela/socket"), ElementsAre(SocketAddress{"/run/vela/socket", false}));
    EXPECT_THAT(parsed("unix:abstract=vela"), ElementsAre(SocketAddress{"vela", true}));
}

TEST(AddressTest, SeveralAreTriedInTheirOrder) {
    EXPECT_THAT(parsed("unix:path=/a;unix:abstract=b;"), ElementsAre(SocketAddress{"/a"}, SocketAddress{"b", true}));
}

TEST(AddressTest, OtherKeysArePassedOver) {
    EXPECT_THAT(parsed("unix:guid=00ff,path=/a,x=y"), ElementsAre(SocketAddress{"/a"}));
}

TEST(AddressTest, BytesMayBeWrittenInHexadecimal) {
    EXPECT_THAT(parsed("unix:path=/a%20b%2C%3b"), ElementsAre(SocketAddress{"/a b,;"}));
}

TEST(AddressTest, ATextIsReadBackAsItWas) {
    const SocketAddress address{"/with space,\xC3\xA4;%", false};
    EXPECT_EQ(address.text(), "unix:path=/with%20space%2c%c3%a4%3b%25");
    EXPECT_THAT(parsed(address.text()), ElementsAre(address));
}

TEST(AddressTest, WhatIsNoSocketIsRefusedByName) {
    EXPECT_EQ(faultOf(""), "the address \"\" names no socket");
    EXPECT_EQ(faultOf(";"), "the address \";\" names no socket");
    EXPECT_EQ(faultOf("tcp:host=x"), "the address \"tcp:host=x\" does not begin with unix:");
    EXPECT_EQ(faultOf("unix:guid=00"), "the address \"unix:guid=00\" has neither a path nor an abstract name");
    EXPECT_EQ(faultOf("unix:path=/a,path=/b"),
              "the address \"unix:path=/a,path=/b\" has no single valid path or abstract name");
    EXPECT_EQ(faultOf("unix:path=/a%2"), "the address \"unix:path=/a%2\" has no single valid path or abstract name");
    EXPECT_EQ(faultOf("unix:path="), "the address \"unix:path=\" has no single valid path or abstract name");
}

TEST(AddressTest, WithoutAnAddressTheUsersServiceComesBeforeTheSystems) {
    EXPECT_THAT(*serviceAddresses("", "/run/user/1000"),
                ElementsAre(SocketAddress{"/run/user/1000/vela/com.orvex.vela.reporting.server"},
                            SocketAddress{"/run/vela/com.orvex.vela.reporting.server"}));
    EXPECT_THAT(*serviceAddresses("", ""), ElementsAre(SocketAddress{"/run/vela/com.orvex.vela.reporting.server"}));
}

TEST(AddressTest, AnAddressIsTheOnlyOne) {
    EXPECT_THAT(*serviceAddresses("unix:path=/a", "/run/user/1000"), ElementsAre(SocketAddress{"/a"}));
    EXPECT_FALSE(serviceAddresses("nonsense", "/run/user/1000"));
}

TEST(AddressTest, AFailureNamesTheLastAddress) {
    const auto connected = connectTo({{"/nonexistent/a"}, {"/nonexistent/b"}}, true);
    ASSERT_FALSE(connected);
    EXPECT_EQ(connected.failure().code, ENOENT);
    EXPECT_EQ(connected.failure().description, "unix:path=/nonexistent/b: No such file or directory");
    EXPECT_EQ(connectTo({{std::string(200, 'x')}}, true).failure().code, ENAMETOOLONG);
    EXPECT_FALSE(connectTo({}, true));
}

} // namespace
} // namespace vela::platform::dbus
