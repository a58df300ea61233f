// The forms of names and signatures.
#include "platform/dbus/Names.h"

#include <gtest/gtest.h>

namespace vela::platform::dbus {

namespace {

using std::string_view_literals::operator""sv;

TEST(NamesTest, Signatures) {
    for (const char* good : {"", "a{sv}uqaax", "(sd)", "a(sd)", "aaaaaaaay", "a{s(ii)}", "v", "((y))", "a{ya{yy}}"}) {
        EXPECT_TRUE(isValidSignature(good)) << good;
    }
    for (const char* bad :
         {"a", "()", "(", ")", "{sv}", "a{vs}", "a{s}", "a{svs}", "a{}", "z", "m", "a{sv", "(ii", "aa", "a{asv}"}) {
        EXPECT_FALSE(isValidSignature(bad)) << bad;
    }
    EXPECT_TRUE(isValidSignature(std::string(255, 'y')));
    EXPECT_FALSE(isValidSignature(std::string(256, 'y')));
    EXPECT_TRUE(isValidSignature(std::string(32, 'a') + "y"));
    EXPECT_FALSE(isValidSignature(std::string(33, 'a') + "y"));
    EXPECT_TRUE(isValidSignature(std::string(32, '(') + "y" + std::string(32, ')')));
    EXPECT_FALSE(isValidSignature(std::string(33, '(') + "y" + std::string(33, ')')));
    EXPECT_FALSE(isValidSignature("y\0y"sv));
}

TEST(NamesTest, BusNames) {
    for (const char* good : {":1.7", ":54h", ":.1", "a.b", "a-b.c_d", "-a.-b"}) {
        EXPECT_TRUE(isValidBusName(good)) << good;
    }
    for (const char* bad : {"", ":1.", ":1..2", ":1 2", "a", "a.", ".a", "a..b", "1a.b", "a.1b c"}) {
        EXPECT_FALSE(isValidBusName(bad)) << bad;
    }
}

TEST(NamesTest, NamesHaveAtMost255Bytes) {
    EXPECT_TRUE(isValidInterfaceName("a." + std::string(253, 'b')));
    EXPECT_FALSE(isValidInterfaceName("a." + std::string(254, 'b')));
    EXPECT_TRUE(isValidMemberName(std::string(255, 'b')));
    EXPECT_FALSE(isValidMemberName(std::string(256, 'b')));
    EXPECT_FALSE(isValidBusName("a." + std::string(254, 'b')));
}

TEST(NamesTest, TextsAreCheckedWordByWord) {
    for (std::size_t length = 1; length < 40; ++length) {
        const std::string good(length, 'a');
        EXPECT_TRUE(isValidText(good));
        for (std::size_t place = 0; place < length; ++place) {
            std::string bad = good;
            bad[place] = '\0';
            EXPECT_FALSE(isValidText(bad)) << length << ' ' << place;
            bad[place] = '\xFF';
            EXPECT_FALSE(isValidText(bad)) << length << ' ' << place;
        }
    }
    EXPECT_TRUE(isValidText("0123456\xC3\xA4 and more text\xF0\x9F\x8E\xB5"));
    EXPECT_FALSE(isValidText("0123456\xC3\xA4 and more\0text"sv));
}

TEST(NamesTest, QuotedTextsAreShortAndValid) {
    EXPECT_EQ(dbus::quoted("a"), "\"a\"");
    EXPECT_EQ(dbus::quoted(""), "\"\"");
    EXPECT_EQ(dbus::quoted("a\nb\x7F"), "\"a?b?\"");
    EXPECT_EQ(dbus::quoted("\xFF"), "\"\xEF\xBF\xBD\"");
    EXPECT_EQ(dbus::quoted(std::string(64, 'a')), '"' + std::string(64, 'a') + '"');
    EXPECT_EQ(dbus::quoted(std::string(65, 'a')), '"' + std::string(64, 'a') + "...\"");
}

} // namespace

} // namespace vela::platform::dbus
