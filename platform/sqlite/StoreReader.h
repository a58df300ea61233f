// Reads the store beside the service that writes it, page by page: between two calls nothing is held open that would
// keep the writer's log from being used anew. One owner at a time.
#pragma once

#include "common/DeliveryLedger.h"
#include "platform/Result.h"
#include "platform/sqlite/SqliteDatabase.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace vela::platform {

/// A row of the view `deliveries`.
struct StoredDelivery {
    std::int64_t seq = 0;
    double time = 0; ///< seconds since 1970
    std::string backend;
    std::string operation;
    std::optional<std::string> name;
    std::optional<std::int64_t> session;
    std::optional<std::int64_t> category;
    std::optional<std::int64_t> type;
    std::string payload; ///< JSON
    std::optional<std::int64_t> metricID;
    std::optional<std::string> record; ///< bytes in the wire format
};

struct StoreFilter {
    std::optional<DeliveryBackend> backend = std::nullopt;
    std::optional<std::int64_t> session = std::nullopt;
    std::optional<double> since = std::nullopt; ///< seconds since 1970
    std::int64_t after = 0;                     ///< a record's seq
};

class StoreReader {
public:
    static constexpr std::size_t kPage = 256;

    /// Fails when there is no file, when it is no store, and when its version is not this program's.
    static Result<StoreReader> open(const std::string& path);

    /// The next deliveries behind `filter.after`, in the order of their seq: `limit` of them, or as many as there are.
    /// Each call is one short read transaction.
    Result<std::vector<StoredDelivery>> read(const StoreFilter& filter, std::size_t limit = kPage);

    /// Whether something was committed since the last call; true at the first.
    Result<bool> changed();
    /// Waits until something is committed, `timeout` at the longest; answers as `changed`.
    Result<bool> waitForChange(std::chrono::milliseconds timeout);

private:
    explicit StoreReader(SqliteDatabase database) : database_(std::move(database)) {}

    SqliteDatabase database_;
    std::optional<std::int64_t> version_; ///< of the data, as `changed` last saw it
};

} // namespace vela::platform
