// What a session leaves at its end: the summary event, and on internal builds a file of its messages.
#include "common/TextFormat.h"
#include "common/VelaReportingUtility.h"
#include "session/SessionFile.h"
#include "session/SessionLog.h"
#include "session/VelaReportingSession.h"

#include <algorithm>
#include <string>
#include <unordered_map>
#include <utility>
#include <vector>

namespace vela {

namespace {

constexpr std::uint32_t kDirectoryPermissions = 0777;
constexpr std::uint32_t kFilePermissions = 0644;

// Joins the values of each key, in one walk over the messages. Messages with the keys of the one before need no
// look-up.
class VelaReportingSummaryGatherer {
public:
    void addFirst(const Key& key, const Value& value) { append(columnOf(key), value); }

    void add(const Dictionary& message) {
        if (!message.hasSameKeysInOrder(previous_)) {
            columnsOfPrevious_.clear();
            for (const auto& entry : message) {
                columnsOfPrevious_.push_back(columnOf(entry.key));
            }
            previous_ = message;
        }
        std::size_t slot = 0;
        for (const auto& entry : message) {
            append(columnsOfPrevious_[slot++], entry.value);
        }
    }

    Dictionary build() const {
        DictionaryBuilder summary;
        for (const Column& column : columns_) {
            summary.add(column.key, std::string_view(column.joined));
        }
        return summary.build();
    }

private:
    struct Column {
        Key key;
        std::string joined;
        bool hasValues = false;
    };

    std::size_t columnOf(const Key& key) {
        const auto [place, isNew] = columnsByKey_.try_emplace(key.object(), columns_.size());
        if (isNew) {
            columns_.push_back({key, {}, false});
        }
        return place->second;
    }

    void append(std::size_t number, ValueRef value) {
        Column& column = columns_[number];
        if (std::exchange(column.hasValues, true)) {
            column.joined += ',';
        }
        appendTextualForm(column.joined, value);
    }

    std::vector<Column> columns_;
    std::unordered_map<const void*, std::size_t> columnsByKey_;
    Dictionary previous_;
    std::vector<std::size_t> columnsOfPrevious_;
};

// When `next` is the message numbered 1,000: makes room for all of them at the length of those so far, so that the text
// of a long session is not copied while it grows.
void reserveForAll(std::string& text, std::span<const StoredMessage> messages, const StoredMessage& next) {
    constexpr std::size_t kSample = 1000;
    constexpr std::size_t kMostRoom = std::size_t{512} * 1024 * 1024; // a wrong guess must not ask for all there is
    if (messages.size() > kSample && &next == &messages[kSample]) {
        text.reserve(std::min(kMostRoom, text.size() / kSample * (messages.size() + messages.size() / 16)));
    }
}

} // namespace

std::optional<Dictionary> VelaReportingSession::createSummaryEventForSession() {
    static const Key summaryEvent("VELA_Session_Summary_Event");
    const LogReporterScope scope(reporterID_);
    const MutexLock lock(nestedAggregatedPayloadData_.mutex());
    const std::span<const StoredMessage> messages = nestedAggregatedPayloadData_.messages();
    if (messages.empty()) {
        return std::nullopt;
    }
    VelaReportingSummaryGatherer gatherer;
    gatherer.addFirst(summaryEvent, serviceType());
    for (const StoredMessage& stored : messages) {
        gatherer.add(stored.message);
    }
    return gatherer.build();
}

void VelaReportingSession::writeSummaryJson() {
    const LogReporterScope scope(reporterID_);
    if (!VelaReportingUtilityIsInternalBuild()) {
        return;
    }
    const std::optional<std::string> text = serialisedMessages();
    if (!text) {
        return;
    }
    const std::string directory = platform_.pathRoot + std::string(kSessionFileDirectory);
    const platform::Result<platform::Done> made =
        platform_.fileSystem.createDirectories(directory, kDirectoryPermissions);
    if (!made) {
        sessionLog().error("can't create logging directory at %@: %@", directory, made.failure().description);
    }
    const std::string path = directory + "/" + summaryFileName();
    const platform::Result<platform::Done> written =
        platform_.fileSystem.writeFileAtomically(path, *text, kFilePermissions);
    if (written) {
        sessionLog().info("jsonOutput writeToURL: %@", path);
    } else {
        sessionLog().error("jsonOutput writeToURL: %@", written.failure().description);
    }
}

// The list as a JSON array of one-entry objects; none where there is no message. Objects and array are written here, so
// that no key is made of every message's identifier and count.
std::optional<std::string> VelaReportingSession::serialisedMessages() {
    constexpr std::size_t kMessageDepth = 2;
    const MutexLock lock(nestedAggregatedPayloadData_.mutex());
    const std::span<const StoredMessage> messages = nestedAggregatedPayloadData_.messages();
    if (messages.empty()) {
        return std::nullopt;
    }
    std::string text;
    char before = '[';
    for (const StoredMessage& stored : messages) {
        reserveForAll(text, messages, stored);
        text += std::exchange(before, ',');
        text += "\n  {\n    ";
        appendJsonString(text, nestedAggregatedPayloadData_.keyOf(stored));
        text += ": ";
        const platform::Result<platform::Done> done =
            platform_.jsonWriting.append(text, Value(stored.message), JsonLayout::Pretty, kMessageDepth);
        if (!done) {
            sessionLog().error("dataWithJSONObject: %@", done.failure().description);
            return std::string();
        }
        text += "\n  }";
    }
    text += "\n]";
    return text;
}

std::string VelaReportingSession::summaryFileName() {
    const platform::WallTime now = platform_.clock.now();
    return formatText("%@-%@-%@-%@.json", sessionFileDate(now, platform_.clock.localOffset(now)), "vela",
                      safeFileNamePart(textualForm(applicationName())), serviceName());
}

} // namespace vela
