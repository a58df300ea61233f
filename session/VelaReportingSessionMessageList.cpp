#include "session/VelaReportingSessionMessageList.h"

#include "common/TextFormat.h"
#include "common/VelaReportingUtility.h"
#include "session/SessionLog.h"

#include <charconv>
#include <limits>

namespace vela {

namespace {

// What differs from message to message without saying anything.
const std::array<Key, 3>& ignoredWhenComparing() {
    static const std::array<Key, 3> keys = {VelaReportingInternalEventProcessUptimeMs,
                                            VelaReportingInternalEventSystemUptimeSec,
                                            VelaReportingInternalEventEpochTime};
    return keys;
}

// Only the plain category 11 is an error by category: one with a flag is not.
bool isError(std::uint32_t category, std::uint32_t type) {
    return category == AudioEventCategoryError || type == AudioEventTypeError;
}

} // namespace

void VelaReportingSessionMessageList::begin() {
    clear();
    exists_ = true;
}

void VelaReportingSessionMessageList::clear() {
    exists_ = false;
    ++generation_;
    messages_ = {};
    messageCount_ = 0;
    kinds_ = {};
    kindsByIdentifier_ = {};
    recent_ = {};
}

bool VelaReportingSessionMessageList::createMessageIdentifierWithCategory(std::uint32_t category, std::uint16_t type,
                                                                          const Dictionary& message) {
    if (!exists_) {
        return false;
    }
    const std::uint32_t number = kindOf(category, type);
    Kind& kind = kinds_[number];
    const bool repeats = kind.count != 0 && equalExcept(messages_[kind.last].message, message, ignoredWhenComparing());
    if (repeats && !isError(category, type)) {
        sessionLog().debug("dropping redundant event");
        return true;
    }
    ++kind.count;
    kind.last = messages_.size();
    messages_.push_back({number, kind.count, message});
    messageCount_ = messages_.size();
    return false;
}

std::string VelaReportingSessionMessageList::keyOf(const StoredMessage& message) const {
    std::string key;
    appendKeyOf(message, key);
    return key;
}

void VelaReportingSessionMessageList::appendKeyOf(const StoredMessage& message, std::string& text) const {
    std::array<char, std::numeric_limits<std::uint32_t>::digits10 + 1> count{};
    const char* const end = std::to_chars(count.data(), count.data() + count.size(), message.count).ptr;
    text += kinds_[message.kind].identifier;
    text += '_';
    text.append(count.data(), static_cast<std::size_t>(end - count.data()));
}

std::optional<std::uint32_t>
VelaReportingSessionMessageList::messageIdentifierCount(std::string_view identifier) const {
    const auto found = kindsByIdentifier_.find(std::string(identifier));
    return found == kindsByIdentifier_.end() ? std::nullopt : std::optional(kinds_[found->second].count);
}

std::uint32_t VelaReportingSessionMessageList::kindOf(std::uint32_t category, std::uint16_t type) {
    const std::uint64_t numbers = kKnown | (static_cast<std::uint64_t>(category) << 16U) | type;
    Recent& recent = recent_[(category * 19U + (category >> 24U) + type) % recent_.size()];
    if (recent.numbers != numbers) {
        recent = {numbers, kindOfIdentifier(formatText("%@_%@", VelaReportingUtilityCategoryString(category),
                                                       VelaReportingUtilityTypeString(type)))};
    }
    return recent.kind;
}

std::uint32_t VelaReportingSessionMessageList::kindOfIdentifier(std::string identifier) {
    const auto [place, isNew] = kindsByIdentifier_.try_emplace(identifier, static_cast<std::uint32_t>(kinds_.size()));
    if (isNew) {
        kinds_.push_back({std::move(identifier), 0, 0});
    }
    return place->second;
}

} // namespace vela
