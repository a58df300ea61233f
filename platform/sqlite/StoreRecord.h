// One delivery on its way to the store, or a mark in the life of a real-time reporting session. One owner at a time.
#pragma once

#include "common/DeliveryLedger.h"
#include "common/values/Dictionary.h"
#include "platform/Clock.h"
#include "platform/UniqueFunction.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string_view>

namespace vela::platform {

/// The numbers stand in the file.
enum class StoreOperation : std::uint8_t {
    Send = 0,
    SendOne = 1,
    Post = 2,
    Snapshot = 3,
    // Marks, which the ledger does not count.
    CreateSession = 4,
    Flush = 5,
    EndSession = 6,
};

/// What the view `deliveries` calls the operations, by number.
inline constexpr std::array<std::string_view, 7> kStoreOperationNames{
    "send", "send_one", "post", "snapshot", "create_session", "flush", "end_session"};

inline std::string_view nameOf(StoreOperation operation) {
    return kStoreOperationNames[static_cast<std::size_t>(operation)];
}

/// Whether the ledger counts records of this operation.
inline bool isDelivery(StoreOperation operation) { return operation <= StoreOperation::Snapshot; }

/// When a record wants its commit.
enum class StoreUrgency : std::uint8_t {
    Usual, ///< with the others
    Soon,  ///< within a few milliseconds, so that what comes right behind it still joins
    Now,
};

struct StoreRecord {
    DeliveryBackend backend = DeliveryBackend::Beacon;
    StoreOperation operation = StoreOperation::Send;
    StoreUrgency urgency = StoreUrgency::Usual;
    WallTime time{};
    std::optional<std::int64_t> session;
    std::optional<std::uint16_t> category;
    std::optional<std::uint16_t> type;
    std::optional<std::uint32_t> number; ///< Joule: the client's; Telem: the metric's
    String name;                         ///< empty for none
    Data bytes;                          ///< Telem: the record in its wire format
    Dictionary payload;

    /// Makes the payload on the writer's thread, called once at the most.
    UniqueFunction<Dictionary()> builder;
    std::size_t builderBytes = 0; ///< about what it holds, and what the payload will
    /// Called on the writer's thread with what became of the record. Hardly any has it: it takes no room in the others.
    std::unique_ptr<UniqueFunction<void(bool stored)>> done;
    /// Whose outcome is counted; null for marks.
    std::shared_ptr<LedgerEntry> entry;

    // Of the store's own.
    std::size_t weight = 0;            ///< what the queue counts it for, in bytes
    std::optional<DropReason> refused; ///< why it is not stored although its group is
};

/// Bytes that a record holds while it waits.
inline std::size_t weightOf(const StoreRecord& record) {
    return sizeof(StoreRecord) + record.name.view().size() + record.bytes.view().size() + memoryOf(record.payload) +
           record.builderBytes;
}

} // namespace vela::platform
