// The diagnostic reporter: a snapshot is a file with the signature, the sessions and the last log lines, and a record
// of it in the store, committed at once. Thread-safe; the store outlives it, its reporters may not.
//
// All work is done on the store's thread, and so is the reply, except that of a snapshot which the store refuses.
#pragma once

#include "platform/FileSystem.h"
#include "platform/Malady.h"
#include "platform/sqlite/DeliveryStore.h"

#include <functional>
#include <memory>
#include <string>
#include <vector>

namespace vela::platform {

class SnapshotSource;

class StoreMalady final : public Malady {
public:
    struct Options {
        std::string folder;                            ///< for the files, "<state>/snapshots"
        std::function<Array()> sessions;               ///< what the service's sessions are doing
        std::function<std::vector<std::string>()> log; ///< its last lines, oldest first
    };

    /// The callables are called on the store's thread, and must not wait for the store.
    StoreMalady(DeliveryStore& store, FileSystem& fileSystem, Options options);

    /// Replies hold "state" ("stored" or "dropped") and "path", or "error" when the file could not be written.
    std::unique_ptr<MaladyReporter> createReporter() override;

private:
    DeliveryStore& store_;
    const std::shared_ptr<SnapshotSource> source_;
};

} // namespace vela::platform
