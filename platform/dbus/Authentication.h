// Both sides of the EXTERNAL authentication that comes before the first message. Pure state machines: bytes in, bytes
// out. Confined to their owner's thread.
//
//     client                               server
//     NUL AUTH EXTERNAL [uid in hex]   ->
//                                      <-  DATA                  (when there was no uid)
//     DATA [uid in hex]                ->
//                                      <-  OK <32 hex digits>    or REJECTED [words]
//     NEGOTIATE_UNIX_FD                ->
//                                      <-  ERROR ...
//     BEGIN                            ->
//     messages                        <->  messages
//
// A client may send everything up to BEGIN, and messages behind it, without waiting for an answer.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <utility>

namespace vela::platform::dbus {

/// What became of the authentication.
enum class AuthenticationState : std::uint8_t {
    Waiting, ///< for more bytes
    Done,    ///< what follows are messages
    Refused, ///< the connection is to be closed once the answer is sent
};

/// Lines that are collected: a longer one ends the attempt.
inline constexpr std::size_t kLongestAuthenticationLine = 1024;

/// Cuts lines that end in CR LF.
class AuthenticationLines {
public:
    enum class Step : std::uint8_t { Line, Incomplete, Invalid };

    /// Takes bytes from `bytes` up to the end of a line, which then is in `line` until the next call.
    Step next(std::string_view& bytes, std::string_view& line);

private:
    std::string collected_;
    bool complete_ = false;
};

class ServerAuthentication {
public:
    /// `peer` is the user by the operating system's word. With a `refusal`, a word for the peer such as
    /// "access-denied", every attempt is answered with it: it stands where the list of mechanisms is, which clients
    /// show.
    ServerAuthentication(std::uint32_t peer, std::string_view serverId, std::string refusal = {})
        : peer_(peer),
          serverId_(serverId),
          refusal_(std::move(refusal)) {}

    /// Takes what it needs from the front of `bytes` and appends to `answer`. After Done, the rest are messages.
    AuthenticationState feed(std::string_view& bytes, std::string& answer);

private:
    enum class Expecting : std::uint8_t { Nul, Auth, Data, Begin };

    AuthenticationState handle(std::string_view line, std::string& answer);
    AuthenticationState identify(std::string_view hex, std::string& answer);
    AuthenticationState reject(std::string& answer);

    std::uint32_t peer_;
    std::string serverId_; ///< 32 hex digits
    std::string refusal_;
    AuthenticationLines lines_;
    Expecting expecting_ = Expecting::Nul;
    int answers_ = 0;
};

class ClientAuthentication {
public:
    /// What a client sends first: all lines up to BEGIN; messages may follow at once. It names no user, so it works
    /// where the two sides count users differently (containers).
    static std::string_view opening();

    /// Takes what it needs from the front of `bytes`. After Done, the rest are messages.
    AuthenticationState feed(std::string_view& bytes);

    /// After Refused: what the server said, as one line.
    const std::string& refusal() const { return refusal_; }

private:
    AuthenticationLines lines_;
    std::string refusal_;
};

} // namespace vela::platform::dbus
