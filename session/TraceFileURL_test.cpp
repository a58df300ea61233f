#include "session/TraceFileURL.h"

#include <gtest/gtest.h>

namespace vela {

namespace {

TEST(TraceFileURLTest, ThePathStandsBehindTheScheme) {
    EXPECT_EQ(pathOfFileURL("file:///var/lib/vela/traces/a.data"), "/var/lib/vela/traces/a.data");
    EXPECT_EQ(pathOfFileURL("file:///"), "/");
}

TEST(TraceFileURLTest, AHostIsPassedOver) { EXPECT_EQ(pathOfFileURL("file://localhost/tmp/a"), "/tmp/a"); }

TEST(TraceFileURLTest, EscapedBytesAreThemselves) {
    EXPECT_EQ(pathOfFileURL("file:///tmp/a%20b%2Fc%c3%A9"), "/tmp/a b/c\xC3\xA9");
}

TEST(TraceFileURLTest, WhatIsNoEscapeStays) {
    EXPECT_EQ(pathOfFileURL("file:///a%"), "/a%");
    EXPECT_EQ(pathOfFileURL("file:///a%2"), "/a%2");
    EXPECT_EQ(pathOfFileURL("file:///a%2g"), "/a%2g");
    EXPECT_EQ(pathOfFileURL("file:///a%%41"), "/a%A");
}

TEST(TraceFileURLTest, WhatIsNoFileURLStays) {
    EXPECT_EQ(pathOfFileURL(""), "");
    EXPECT_EQ(pathOfFileURL("/tmp/a%20b"), "/tmp/a%20b");
    EXPECT_EQ(pathOfFileURL("file://host"), "file://host");
    EXPECT_EQ(pathOfFileURL("https://host/a"), "https://host/a");
}

} // namespace

} // namespace vela
