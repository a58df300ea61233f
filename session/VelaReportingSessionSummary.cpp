// What a session leaves at its end: the summary event, and on internal builds a file of its messages.
#include "common/TextFormat.h"
#include "common/VelaReportingUtility.h"
#include "session/SessionFile.h"
#include "session/SessionLog.h"
#include "session/VelaReportingSession.h"

#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <vector>

namespace vela {

namespace {

constexpr std::uint32_t kDirectoryPermissions = 0777;
constexpr std::uint32_t kFilePermissions = 0644;
/// The session file is made and written in pieces of at least this size, but for the last.
constexpr std::size_t kPieceBytes = std::size_t{1} << 20U;

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

    /// The last call: the texts go as they are copied, so that those of a long session do not all exist twice.
    Dictionary build() {
        DictionaryBuilder summary;
        for (Column& column : columns_) {
            summary.add(column.key, std::string_view(column.joined));
            std::string().swap(column.joined);
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
    MessageReading reading;
    {
        const MutexLock lock(nestedAggregatedPayloadData_.mutex());
        reading = {nestedAggregatedPayloadData_.generation(), 0, nestedAggregatedPayloadData_.messages().size()};
    }
    if (reading.end == 0) {
        return;
    }
    const std::string directory = platform_.pathRoot + std::string(kSessionFileDirectory);
    const platform::Result<platform::Done> made =
        platform_.fileSystem.createDirectories(directory, kDirectoryPermissions);
    const std::string path = directory + "/" + summaryFileName();
    std::unique_ptr<platform::PendingFile> file = platform_.fileSystem.createFile(path, kFilePermissions);
    if (!appendMessages(*file, reading)) {
        file = platform_.fileSystem.createFile(path, kFilePermissions); // nothing of the torn text
    }
    // Told behind what became of the messages, although it was tried before.
    if (!made) {
        sessionLog().error("can't create logging directory at %@: %@", directory, made.failure().description);
    }
    const platform::Result<platform::Done> written = file->commit();
    if (written) {
        sessionLog().info("jsonOutput writeToURL: %@", path);
    } else {
        sessionLog().error("jsonOutput writeToURL: %@", written.failure().description);
    }
}

// The list as a JSON array of one-entry objects, in pieces, so that its whole text never exists. False when a message
// cannot be serialised; that is found, and logged, whether the file can be written or not.
bool VelaReportingSession::appendMessages(platform::PendingFile& file, MessageReading reading) {
    std::string piece;
    piece.reserve(kPieceBytes + kPieceBytes / 8);
    piece += '[';
    while (reading.next < reading.end) {
        if (const std::optional<platform::Failure> failure = appendPiece(piece, reading)) {
            sessionLog().error("dataWithJSONObject: %@", failure->description);
            return false;
        }
        file.append(piece);
        piece.clear();
    }
    file.append("\n]");
    return true;
}

// The next messages of the list, as many as make a piece. The lock is held for no longer than that: what is sent
// meanwhile stands behind the end of the reading. Objects and array are written here, so that no key is made of every
// message's identifier and count.
std::optional<platform::Failure> VelaReportingSession::appendPiece(std::string& piece, MessageReading& reading) {
    constexpr std::size_t kMessageDepth = 2;
    std::string key;
    const MutexLock lock(nestedAggregatedPayloadData_.mutex());
    if (nestedAggregatedPayloadData_.generation() != reading.generation) {
        reading.end = reading.next; // the session ended meanwhile, and its list with it
        return std::nullopt;
    }
    const std::span<const StoredMessage> messages = nestedAggregatedPayloadData_.messages();
    for (; reading.next < reading.end && piece.size() < kPieceBytes; ++reading.next) {
        const StoredMessage& stored = messages[reading.next];
        key.clear();
        nestedAggregatedPayloadData_.appendKeyOf(stored, key);
        piece += reading.next == 0 ? "\n  {\n    " : ",\n  {\n    ";
        appendJsonString(piece, key);
        piece += ": ";
        const platform::Result<platform::Done> done =
            platform_.jsonWriting.append(piece, Value(stored.message), JsonLayout::Pretty, kMessageDepth);
        if (!done) {
            return done.failure();
        }
        piece += "\n  }";
    }
    return std::nullopt;
}

std::string VelaReportingSession::summaryFileName() {
    const platform::WallTime now = platform_.clock.now();
    return formatText("%@-%@-%@-%@.json", sessionFileDate(now, platform_.clock.localOffset(now)), "vela",
                      safeFileNamePart(textualForm(applicationName())), serviceName());
}

} // namespace vela
