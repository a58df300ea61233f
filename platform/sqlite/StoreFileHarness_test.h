// What the tests of the store's file share: files without queue and thread, and records for them.
#pragma once

#include "platform/sqlite/StoreFile.h"
#include "platform/sqlite/StoreHarness_test.h"

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <gtest/gtest.h>
#include <memory>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace vela::platform {

constexpr std::uint64_t kMiB = 1024 * 1024;

class StoreFileHarness : public StoreHarness {
protected:
    std::unique_ptr<StoreFile> openFile(std::uint64_t maxBytes) {
        options_.file.maxBytes = maxBytes;
        Result<std::unique_ptr<StoreFile>> file = StoreFile::open(options_.file);
        EXPECT_TRUE(file) << (file ? "" : file.failure().description);
        return file ? *std::move(file) : nullptr;
    }
    StoreRecord record(DeliveryBackend backend, const Dictionary& payload) {
        StoreRecord record;
        record.backend = backend;
        record.session = ++number_ % 100;
        record.payload = payload;
        record.entry = entry_;
        entry_->received(backend);
        return record;
    }
    /// Stores `count` records of about `bytes` bytes in groups of 50.
    void fill(StoreFile& file, DeliveryBackend backend, int count, std::size_t bytes = 400) {
        const std::string text(bytes, 'x');
        while (count > 0) {
            std::vector<StoreRecord> group;
            for (; count > 0 && group.size() < 50; --count) {
                group.push_back(record(backend, {{"text", std::string_view(text)}}));
            }
            store(file, group);
        }
    }
    void store(StoreFile& file, std::span<StoreRecord> group) {
        while (!group.empty()) {
            const Result<std::size_t> stored = file.store(group, ledger_);
            ASSERT_TRUE(stored) << stored.failure().description;
            ASSERT_GT(*stored, 0U);
            for (const StoreRecord& each : group.first(*stored)) {
                if (!each.refused) {
                    each.entry->delivered(each.backend);
                }
            }
            group = group.subspan(*stored);
        }
    }
    /// A record with a key list of its own.
    StoreRecord invention() {
        const std::string key = "k" + std::to_string(++inventions_);
        return record(DeliveryBackend::Beacon, {{std::string_view(key), 1}});
    }
    /// As many of them as the lists of a back end.
    void inventAll(StoreFile& file) {
        std::vector<StoreRecord> group;
        while (group.size() < 1'024) {
            group.push_back(invention());
        }
        store(file, group);
    }
    /// A record of about 6 KiB whose keys are too long to be shared.
    StoreRecord unshared() {
        const std::string key(6'000, 'k');
        return record(DeliveryBackend::Beacon, {{std::string_view(key), 1}});
    }
    std::uint64_t fileSize() const { return std::filesystem::file_size(options_.file.path); }
    std::uint64_t logSize() const { return std::filesystem::file_size(options_.file.path + "-wal"); }

    std::shared_ptr<LedgerEntry> entry_ = ledger_.open(7, 42);
    std::int64_t number_ = 0;
    int inventions_ = 0;
};

} // namespace vela::platform
