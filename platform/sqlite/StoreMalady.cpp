#include "platform/sqlite/StoreMalady.h"

#include "common/values/Json.h"
#include "platform/sqlite/SnapshotFolder.h"

#include <optional>
#include <string_view>
#include <utility>

namespace vela::platform {

/// What every snapshot is made of. Used on the store's thread only.
class SnapshotSource {
public:
    SnapshotSource(StoreMalady::Options options, FileSystem& fileSystem, const Clock& clock)
        : options_(std::move(options)),
          folder_(options_.folder, fileSystem),
          clock_(clock) {}

    /// Writes the file: what was asked for, then the state of the service.
    Result<std::string> write(const Dictionary& request) {
        DictionaryBuilder bundle;
        const WallTime now = clock_.now();
        bundle.add("time", Date{std::chrono::duration<double>(now.time_since_epoch()).count()});
        for (const auto& [key, value] : request) {
            bundle.add(key, Value(value));
        }
        bundle.add("sessions", options_.sessions ? options_.sessions() : Array());
        ArrayBuilder lines;
        for (const std::string& line : options_.log ? options_.log() : std::vector<std::string>()) {
            lines.add(std::string_view(line));
        }
        bundle.add("log", lines.build());
        return folder_.write(now, jsonText(Value(bundle.build()), JsonLayout::Pretty) + "\n");
    }

private:
    const StoreMalady::Options options_;
    SnapshotFolder folder_;
    const Clock& clock_;
};

namespace {

constexpr std::size_t kUsualSnapshot = 4096; // bytes

Dictionary dictionaryOf(const MaladySignature& signature) {
    DictionaryBuilder builder;
    builder.add("domain", std::string_view(signature.domain));
    builder.add("type", std::string_view(signature.type));
    builder.add("subType", std::string_view(signature.subType));
    builder.add("subtypeContext", std::string_view(signature.subtypeContext));
    builder.add("detectedProcess", std::string_view(signature.detectedProcess));
    if (signature.triggerThresholdValues) {
        builder.add("triggerThresholdValues", std::string_view(*signature.triggerThresholdValues));
    }
    return builder.build();
}

/// One snapshot on its way through the store's thread.
struct Snapshot {
    Dictionary request;
    UniqueFunction<void(const Dictionary&)> reply;
    Dictionary outcome; ///< "path" or "error"

    /// Writes the file; answers the record's payload.
    Dictionary take(SnapshotSource& source) {
        const Result<std::string> path = source.write(request);
        DictionaryBuilder told;
        if (path) {
            told.add("path", std::string_view(*path));
        } else {
            told.add("error", std::string_view(path.failure().description));
        }
        outcome = told.build();
        return request.merging(outcome);
    }

    void answer(bool stored) {
        if (reply) {
            reply(outcome.setting(Key("state"), stored ? "stored" : "dropped"));
            reply.reset();
        }
    }
};

class StoreMaladyReporter final : public MaladyReporter {
public:
    StoreMaladyReporter(DeliveryStore& store, std::shared_ptr<SnapshotSource> source)
        : store_(store),
          source_(std::move(source)) {}

    void requestSnapshot(const MaladySignature& signature, double seconds, std::optional<Dictionary> event,
                         std::optional<Dictionary> payload, UniqueFunction<void(const Dictionary&)> reply) override {
        DictionaryBuilder request;
        request.add("signature", dictionaryOf(signature));
        request.add("seconds", seconds);
        if (event) {
            request.add("event", *std::move(event));
        }
        if (payload) {
            request.add("payload", *std::move(payload));
        }
        const auto snapshot = std::make_shared<Snapshot>(Snapshot{request.build(), std::move(reply), {}});
        StoreRecord record = store_.newDelivery(DeliveryBackend::Malady, StoreOperation::Snapshot);
        record.urgency = StoreUrgency::Now;
        record.builder = [snapshot, source = source_] { return snapshot->take(*source); };
        record.builderBytes = kUsualSnapshot;
        record.done =
            std::make_unique<UniqueFunction<void(bool)>>([snapshot](bool stored) { snapshot->answer(stored); });
        store_.add(std::move(record));
    }

private:
    DeliveryStore& store_;
    const std::shared_ptr<SnapshotSource> source_;
};

} // namespace

StoreMalady::StoreMalady(DeliveryStore& store, FileSystem& fileSystem, Options options)
    : store_(store),
      source_(std::make_shared<SnapshotSource>(std::move(options), fileSystem, store.clock())) {}

std::unique_ptr<MaladyReporter> StoreMalady::createReporter() {
    return std::make_unique<StoreMaladyReporter>(store_, source_);
}

} // namespace vela::platform
