#include "platform/dbus/Authentication.h"

#include <algorithm>
#include <charconv>
#include <optional>
#include <system_error>

namespace vela::platform::dbus {

namespace {

using std::string_view_literals::operator""sv; // NOLINT(misc-unused-using-decls): it is used

/// So many lines may be answered before the attempt counts as failed.
constexpr int kMostAnswers = 16;

std::optional<unsigned> hexDigit(char digit) {
    if (digit >= '0' && digit <= '9') {
        return static_cast<unsigned>(digit - '0');
    }
    const char lower = static_cast<char>(digit | 0x20);
    return lower >= 'a' && lower <= 'f' ? std::optional(static_cast<unsigned>(lower - 'a') + 10U) : std::nullopt;
}

/// The user whose decimal digits stand in `hex`, each as two hexadecimal ones.
std::optional<std::uint32_t> userOf(std::string_view hex) {
    std::string text;
    for (; hex.size() >= 2; hex.remove_prefix(2)) {
        const auto high = hexDigit(hex[0]);
        const auto low = hexDigit(hex[1]);
        if (!high || !low) {
            return std::nullopt;
        }
        text.push_back(static_cast<char>(*high * 16U + *low));
    }
    std::uint32_t user = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), user);
    const bool whole = hex.empty() && error == std::errc() && end == text.data() + text.size();
    return whole ? std::optional(user) : std::nullopt;
}

/// Takes the first word and the space behind it.
std::string_view takeWord(std::string_view& line) {
    const std::size_t end = std::min(line.find(' '), line.size());
    const std::string_view word = line.substr(0, end);
    line.remove_prefix(std::min(end + 1, line.size()));
    return word;
}

} // namespace

AuthenticationLines::Step AuthenticationLines::next(std::string_view& bytes, std::string_view& line) {
    if (complete_) {
        collected_.clear();
        complete_ = false;
    }
    while (!bytes.empty()) {
        const char byte = bytes.front();
        bytes.remove_prefix(1);
        collected_.push_back(byte);
        if (byte == '\n') {
            if (collected_.size() < 2 || collected_[collected_.size() - 2] != '\r') {
                return Step::Invalid;
            }
            complete_ = true;
            line = std::string_view(collected_).substr(0, collected_.size() - 2);
            return Step::Line;
        }
        const auto code = static_cast<unsigned char>(byte);
        if (collected_.size() > kLongestAuthenticationLine || code == 0 || code >= 0x80) {
            return Step::Invalid;
        }
    }
    return Step::Incomplete;
}

AuthenticationState ServerAuthentication::feed(std::string_view& bytes, std::string& answer) {
    if (expecting_ == Expecting::Nul && !bytes.empty()) {
        if (bytes.front() != '\0') {
            return AuthenticationState::Refused;
        }
        bytes.remove_prefix(1);
        expecting_ = Expecting::Auth;
    }
    std::string_view line;
    while (expecting_ != Expecting::Nul) {
        switch (lines_.next(bytes, line)) {
        case AuthenticationLines::Step::Incomplete:
            return AuthenticationState::Waiting;
        case AuthenticationLines::Step::Invalid:
            return AuthenticationState::Refused;
        case AuthenticationLines::Step::Line:
            break;
        }
        const AuthenticationState state = handle(line, answer);
        if (state != AuthenticationState::Waiting) {
            return state;
        }
        if (++answers_ > kMostAnswers) {
            return AuthenticationState::Refused;
        }
    }
    return AuthenticationState::Waiting;
}

AuthenticationState ServerAuthentication::handle(std::string_view line, std::string& answer) {
    const std::string_view command = takeWord(line);
    if (command == "BEGIN") {
        return expecting_ == Expecting::Begin ? AuthenticationState::Done : AuthenticationState::Refused;
    }
    if (command == "AUTH" && expecting_ == Expecting::Auth) {
        if (takeWord(line) != "EXTERNAL" || !refusal_.empty()) {
            return reject(answer);
        }
        if (!line.empty()) {
            return identify(line, answer);
        }
        answer += "DATA\r\n";
        expecting_ = Expecting::Data;
        return AuthenticationState::Waiting;
    }
    if (command == "DATA" && expecting_ == Expecting::Data) {
        return identify(line, answer);
    }
    if (command == "CANCEL" || command == "ERROR") {
        return reject(answer);
    }
    answer += command == "NEGOTIATE_UNIX_FD" ? "ERROR \"File descriptors are not supported\"\r\n"
                                             : "ERROR \"Not understood here\"\r\n";
    return AuthenticationState::Waiting;
}

AuthenticationState ServerAuthentication::identify(std::string_view hex, std::string& answer) {
    if (!hex.empty() && userOf(hex) != peer_) {
        return reject(answer);
    }
    answer += "OK " + serverId_ + "\r\n";
    expecting_ = Expecting::Begin;
    return AuthenticationState::Waiting;
}

AuthenticationState ServerAuthentication::reject(std::string& answer) {
    expecting_ = Expecting::Auth;
    if (!refusal_.empty()) {
        answer += "REJECTED " + refusal_ + "\r\n";
        return AuthenticationState::Refused;
    }
    answer += "REJECTED EXTERNAL\r\n";
    return AuthenticationState::Waiting;
}

std::string_view ClientAuthentication::opening() { return "\0AUTH EXTERNAL\r\nDATA\r\nBEGIN\r\n"sv; }

AuthenticationState ClientAuthentication::feed(std::string_view& bytes) {
    std::string_view line;
    while (true) {
        switch (lines_.next(bytes, line)) {
        case AuthenticationLines::Step::Incomplete:
            return AuthenticationState::Waiting;
        case AuthenticationLines::Step::Invalid:
            refusal_ = "the answer is no line of the D-Bus authentication";
            return AuthenticationState::Refused;
        case AuthenticationLines::Step::Line:
            break;
        }
        if (line.substr(0, 3) == "OK ") {
            return AuthenticationState::Done;
        }
        if (line.substr(0, 4) != "DATA") {
            refusal_ = line;
            return AuthenticationState::Refused;
        }
    }
}

} // namespace vela::platform::dbus
