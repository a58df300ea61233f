#include "platform/sqlite/StoreBeacon.h"

#include "platform/sqlite/StoreBeaconSession.h"

#include <array>
#include <cstddef>
#include <sys/random.h>
#include <utility>

namespace vela::platform {

namespace {

const Key kSessionInfo("session_info");
const Key kUserInfo("user_info");

std::optional<Array> arrayOf(const std::vector<std::string>& names) {
    if (names.empty()) {
        return std::nullopt;
    }
    ArrayBuilder array;
    for (const std::string& name : names) {
        array.add(std::string_view(name));
    }
    return array.build();
}

// Nobody can guess a token, so nobody can claim a place below another's.
std::string randomDigits() {
    std::array<unsigned char, 16> bytes{};
    std::size_t filled = 0;
    while (filled < bytes.size()) {
        const ssize_t got = getrandom(bytes.data() + filled, bytes.size() - filled, 0);
        filled += got > 0 ? static_cast<std::size_t>(got) : 0;
    }
    constexpr std::string_view kDigits = "0123456789abcdef";
    std::string digits;
    for (const unsigned char byte : bytes) {
        digits += kDigits[byte >> 4U];
        digits += kDigits[byte & 0xFU];
    }
    return digits;
}

} // namespace

StoreBeacon::StoreBeacon(DeliveryStore& store, const std::vector<std::string>& backends)
    : store_(store),
      backends_(arrayOf(backends)) {}

Value StoreBeacon::newBeaconHierarchyToken(ValueRef parent) {
    const std::string above = parent.isString() ? std::string(parent.text()) + "." : std::string();
    return std::string_view(above + randomDigits());
}

std::shared_ptr<BeaconSession> StoreBeacon::createBeaconSession(const Dictionary& sessionInfo,
                                                                const Dictionary& userInfo) {
    const BeaconSource source(sessionInfo, userInfo);
    StoreRecord record = source.record(StoreOperation::CreateSession);
    DictionaryBuilder payload;
    payload.add(kSessionInfo, sessionInfo);
    payload.add(kUserInfo, userInfo);
    record.payload = payload.build();
    store_.add(std::move(record));
    return std::make_shared<StoreBeaconSession>(store_, source, backends_);
}

Result<Done> StoreBeacon::sendOneBeaconMessage(const Dictionary& sessionInfo, const Dictionary& userInfo,
                                               std::uint16_t category, std::uint16_t type, const Dictionary& payload) {
    StoreRecord record = BeaconSource(sessionInfo, userInfo).record(StoreOperation::SendOne);
    record.category = category;
    record.type = type;
    record.payload = payload;
    return sendBeaconRecord(store_, std::move(record));
}

} // namespace vela::platform
