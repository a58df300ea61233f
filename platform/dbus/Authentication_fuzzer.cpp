// Takes any bytes for a client's and for a server's authentication, whole and byte by byte: both must end the same.
#include "platform/dbus/Authentication.h"

#include <cstdint>
#include <cstdlib>

namespace {

using namespace vela::platform::dbus;

struct Outcome {
    AuthenticationState state = AuthenticationState::Waiting;
    std::string said;
    std::size_t left = 0;

    bool operator==(const Outcome&) const = default;
};

/// Feeds `all` in pieces of `step` bytes.
template <class Feed>
Outcome feedInSteps(std::string_view all, std::size_t step, Feed feed) {
    Outcome outcome;
    while (!all.empty() && outcome.state == AuthenticationState::Waiting) {
        std::string_view piece = all.substr(0, step);
        const std::size_t bytes = piece.size();
        outcome.state = feed(piece, outcome.said);
        all.remove_prefix(bytes - piece.size());
    }
    outcome.left = all.size();
    return outcome;
}

template <class MakeFeed>
void requireSameInSteps(std::string_view all, const MakeFeed& makeFeed) {
    const Outcome whole = feedInSteps(all, all.size(), makeFeed());
    if (!(feedInSteps(all, 1, makeFeed()) == whole)) {
        std::abort();
    }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const std::string_view all(reinterpret_cast<const char*>(data), size);
    requireSameInSteps(all, [] {
        return [server = ServerAuthentication(1000, "0123456789abcdef0123456789abcdef")](
                   std::string_view& bytes, std::string& answer) mutable { return server.feed(bytes, answer); };
    });
    requireSameInSteps(all, [] {
        return [client = ClientAuthentication()](std::string_view& bytes, std::string& said) mutable {
            const AuthenticationState state = client.feed(bytes);
            said = client.refusal();
            return state;
        };
    });
    return 0;
}
