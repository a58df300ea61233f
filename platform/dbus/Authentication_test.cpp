// Both sides of the authentication, line by line.
#include "platform/dbus/Authentication.h"

#include <gtest/gtest.h>

namespace vela::platform::dbus {

namespace {

using State = AuthenticationState;
using std::string_view_literals::operator""sv;

constexpr std::string_view kId = "0123456789abcdef0123456789abcdef";
constexpr std::string_view kOk = "OK 0123456789abcdef0123456789abcdef\r\n";

struct Answered {
    State state = State::Waiting;
    std::string answer;
    std::string rest;
};

Answered serve(std::string_view bytes, std::uint32_t peer = 1000, std::string refusal = {}) {
    ServerAuthentication server(peer, kId, std::move(refusal));
    Answered result;
    result.state = server.feed(bytes, result.answer);
    result.rest = bytes;
    return result;
}

TEST(ServerAuthenticationTest, TheUserOfTheSocketIsTaken) {
    const Answered result = serve("\0AUTH EXTERNAL 31303030\r\nBEGIN\r\nmessages"sv);
    EXPECT_EQ(result.state, State::Done);
    EXPECT_EQ(result.answer, kOk);
    EXPECT_EQ(result.rest, "messages");
}

TEST(ServerAuthenticationTest, BytesMayComeOneByOne) {
    ServerAuthentication server(1000, kId);
    std::string answer;
    const std::string_view all = "\0AUTH EXTERNAL 31303030\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n"sv;
    for (std::size_t index = 0; index < all.size(); ++index) {
        std::string_view one = all.substr(index, 1);
        EXPECT_EQ(server.feed(one, answer), index + 1 == all.size() ? State::Done : State::Waiting);
        EXPECT_EQ(one, "");
    }
    EXPECT_EQ(answer, std::string(kOk) + "ERROR \"File descriptors are not supported\"\r\n");
}

TEST(ServerAuthenticationTest, AnotherUserIsRejectedAndMayTryAgain) {
    const Answered result = serve("\0AUTH EXTERNAL 30\r\nAUTH EXTERNAL 31303030\r\nBEGIN\r\n"sv);
    EXPECT_EQ(result.state, State::Done);
    EXPECT_EQ(result.answer, "REJECTED EXTERNAL\r\n" + std::string(kOk));
}

TEST(ServerAuthenticationTest, NoUserMeansThatOfTheSocket) {
    const Answered result = serve("\0AUTH EXTERNAL\r\nDATA\r\nBEGIN\r\n"sv);
    EXPECT_EQ(result.state, State::Done);
    EXPECT_EQ(result.answer, "DATA\r\n" + std::string(kOk));
    EXPECT_EQ(serve("\0AUTH EXTERNAL\r\nDATA 31303030\r\nBEGIN\r\n"sv).state, State::Done);
    EXPECT_EQ(serve("\0AUTH EXTERNAL\r\nDATA 30\r\n"sv).answer, "DATA\r\nREJECTED EXTERNAL\r\n");
}

TEST(ServerAuthenticationTest, UsersThatAreNoNumbersAreRejected) {
    for (const char* user : {"3", "3g", "2D31", "3130303020", "34323934393637323936", "zz"}) {
        const std::string line = std::string("\0AUTH EXTERNAL "sv) + user + "\r\n";
        EXPECT_EQ(serve(line).answer, "REJECTED EXTERNAL\r\n") << user;
    }
}

TEST(ServerAuthenticationTest, OtherMechanismsAreRejected) {
    EXPECT_EQ(serve("\0AUTH\r\n"sv).answer, "REJECTED EXTERNAL\r\n");
    EXPECT_EQ(serve("\0AUTH ANONYMOUS\r\n"sv).answer, "REJECTED EXTERNAL\r\n");
    EXPECT_EQ(serve("\0AUTH DBUS_COOKIE_SHA1 31303030\r\n"sv).answer, "REJECTED EXTERNAL\r\n");
}

TEST(ServerAuthenticationTest, BeginBeforeOkEndsTheAttempt) {
    EXPECT_EQ(serve("\0BEGIN\r\n"sv).state, State::Refused);
    EXPECT_EQ(serve("\0AUTH EXTERNAL 30\r\nBEGIN\r\n"sv).state, State::Refused);
    EXPECT_EQ(serve("\0AUTH EXTERNAL 31303030\r\nCANCEL\r\nBEGIN\r\n"sv).state, State::Refused);
}

TEST(ServerAuthenticationTest, GarbageEndsTheAttempt) {
    EXPECT_EQ(serve("AUTH EXTERNAL 31303030\r\n").state, State::Refused) << "no NUL";
    EXPECT_EQ(serve("\0AUTH EXTERNAL 31303030\n"sv).state, State::Refused) << "no CR";
    EXPECT_EQ(serve("\0\xFF"sv).state, State::Refused);
    EXPECT_EQ(serve("\0\0"sv).state, State::Refused);
    EXPECT_EQ(serve(std::string(1, '\0') + std::string(1024, 'x')).state, State::Waiting);
    EXPECT_EQ(serve(std::string(1, '\0') + std::string(1025, 'x')).state, State::Refused);
}

TEST(ServerAuthenticationTest, UnknownCommandsAreAnsweredAFewTimes) {
    EXPECT_EQ(serve("\0HELLO\r\n"sv).answer, "ERROR \"Not understood here\"\r\n");
    std::string many(1, '\0');
    for (int count = 0; count < 17; ++count) {
        EXPECT_EQ(serve(many).state, State::Waiting) << count;
        many += "X\r\n";
    }
    EXPECT_EQ(serve(many).state, State::Refused);
}

TEST(ServerAuthenticationTest, ARefusedPeerIsToldWhyAfterItsFirstAttempt) {
    const Answered result = serve("\0AUTH EXTERNAL 31303030\r\nBEGIN\r\n"sv, 1000, "access-denied");
    EXPECT_EQ(result.state, State::Refused);
    EXPECT_EQ(result.answer, "REJECTED access-denied\r\n");
}

TEST(ClientAuthenticationTest, OpensAndBeginsAtOnce) {
    EXPECT_EQ(ClientAuthentication::opening(), "\0AUTH EXTERNAL\r\nDATA\r\nBEGIN\r\n"sv);
    ClientAuthentication client;
    std::string answer = "DATA\r\n" + std::string(kOk) + "messages";
    std::string_view bytes = answer;
    EXPECT_EQ(client.feed(bytes), State::Done);
    EXPECT_EQ(bytes, "messages");
}

TEST(ClientAuthenticationTest, AnswersMayComeOneByOne) {
    ClientAuthentication client;
    const std::string answer = "DATA\r\n" + std::string(kOk);
    for (std::size_t index = 0; index < answer.size(); ++index) {
        std::string_view one = std::string_view(answer).substr(index, 1);
        EXPECT_EQ(client.feed(one), index + 1 == answer.size() ? State::Done : State::Waiting);
    }
}

TEST(ClientAuthenticationTest, ARefusalIsTheServersLine) {
    ClientAuthentication client;
    std::string_view bytes = "REJECTED limits.clients_per_user=256\r\n";
    EXPECT_EQ(client.feed(bytes), State::Refused);
    EXPECT_EQ(client.refusal(), "REJECTED limits.clients_per_user=256");
}

TEST(ClientAuthenticationTest, WhatIsNoLineIsARefusal) {
    ClientAuthentication client;
    std::string_view bytes = "l\1\0\1"sv;
    EXPECT_EQ(client.feed(bytes), State::Refused);
    EXPECT_EQ(client.refusal(), "the answer is no line of the D-Bus authentication");
}

TEST(AuthenticationTest, TheTwoSidesAgree) {
    std::string answer;
    std::string_view opening = ClientAuthentication::opening();
    ServerAuthentication server(4711, kId);
    EXPECT_EQ(server.feed(opening, answer), State::Done);
    EXPECT_EQ(opening, "");
    std::string_view bytes = answer;
    EXPECT_EQ(ClientAuthentication().feed(bytes), State::Done);
}

} // namespace

} // namespace vela::platform::dbus
