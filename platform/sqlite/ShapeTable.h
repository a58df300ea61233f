// Interned lists of keys: a record's row holds its values and the number of its shape, which is the event's name and
// the keys of the payload.
//
// Clients choose keys, so the table is bounded; what finds no room is stored with its keys in its own row. Shapes that
// no row needs any more make room for new ones. Confined to the thread that owns the database.
#pragma once

#include "common/DeliveryLedger.h"
#include "common/values/Dictionary.h"
#include "platform/sqlite/SqliteDatabase.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <unordered_map>

namespace vela::platform {

class ShapeTable {
public:
    struct Bounds {
        std::int64_t shapes = 1024;          ///< of one back end
        std::int64_t bytes = 1024 * 1024;    ///< of one back end
        std::size_t longestShape = 4 * 1024; ///< bytes of name and keys
    };
    /// What stands for a payload that brings its keys with it.
    static constexpr std::int64_t kNoShape = 0;

    /// `database` outlives the table.
    ShapeTable(SqliteDatabase& database, const Bounds& bounds);
    /// Reads how much is there; `lastSeq` is the number of the newest record.
    [[nodiscard]] bool load(std::int64_t lastSeq);

    /// The shape of a payload that is stored as record `seq`, or kNoShape; none when the database failed.
    std::optional<std::int64_t> shapeOf(DeliveryBackend backend, const String& name, const Dictionary& payload,
                                        std::int64_t seq);
    /// The oldest record of a back end has this number now.
    void setOldest(DeliveryBackend backend, std::int64_t seq) { part(backend).oldest = seq; }
    /// What was done since the last commit is undone, and `setOldest` was called; `lastSeq` as for `load`.
    [[nodiscard]] bool rolledBack(std::int64_t lastSeq);

private:
    struct Key {
        DeliveryBackend backend;
        String name;
        Dictionary keys; ///< the payload's keys with values of no meaning
    };
    struct Wanted {
        DeliveryBackend backend;
        const String& name;
        const Dictionary& payload;
    };
    struct Hash {
        using is_transparent = void;
        std::size_t operator()(const Wanted& wanted) const;
        std::size_t operator()(const Key& key) const { return (*this)(Wanted{key.backend, key.name, key.keys}); }
    };
    struct Equal {
        using is_transparent = void;
        bool operator()(const Key& left, const Wanted& right) const {
            return left.backend == right.backend && left.name == right.name &&
                   left.keys.hasSameKeysInOrder(right.payload);
        }
        bool operator()(const Wanted& left, const Key& right) const { return (*this)(right, left); }
        bool operator()(const Key& left, const Key& right) const {
            return (*this)(left, Wanted{right.backend, right.name, right.keys});
        }
    };
    struct Shape {
        std::int64_t number;
        std::int64_t lastUsed; ///< number of the newest record that has it
    };
    /// What is known of one back end's shapes.
    struct Part {
        std::int64_t shapes = 0;
        std::int64_t bytes = 0;
        std::int64_t oldest = 0;
        std::int64_t collectBehind = 0; ///< while the oldest record has no greater number, nothing can be removed
    };

    Part& part(DeliveryBackend backend) { return parts_[static_cast<std::size_t>(backend)]; }
    std::optional<std::int64_t> intern(const Wanted& wanted, std::int64_t seq);
    std::optional<std::int64_t> findStored(const Wanted& wanted, const std::string& keys);
    std::optional<std::int64_t> insert(const Wanted& wanted, const std::string& keys, std::int64_t seq);
    bool hasRoom(const Part& part, std::size_t bytes) const;
    bool removeUnused(DeliveryBackend backend);
    std::unordered_map<std::int64_t, std::int64_t> lastUses(DeliveryBackend backend) const;

    SqliteDatabase& database_;
    const Bounds bounds_;
    SqliteStatement find_;
    SqliteStatement insert_;
    SqliteStatement list_;
    SqliteStatement remove_;
    std::array<Part, kDeliveryBackends> parts_{};
    std::unordered_map<Key, Shape, Hash, Equal> known_; ///< a part of those in the file
    std::int64_t loadedAt_ = 0; ///< newest record when `known_` was empty: no unknown shape has a newer one
};

} // namespace vela::platform
