// Key lists shared by dictionaries. Internal to this folder; see Dictionary.h.
//
// For every sequence of different keys there is at most one shape, so that two dictionaries have the same keys in the
// same order exactly when their shapes are the same pointer. One table holds a reference to each; shapes that only the
// table holds are dropped in sweeps when it has grown. In front of the table every thread has a small cache, which also
// remembers steps from one shape to another, so that the usual look-up takes no lock.
#pragma once

#include "common/values/Key.h"

#include <cstddef>
#include <cstdint>
#include <span>
#include <vector>

namespace vela::detail {

constexpr std::uint32_t kNoSlot = 0xFFFFFFFF;

/// | Object | hash | index size | bytes | keys | index: slot + 1 by key hash, only for more than kLinear keys |
struct ShapeObject : Object {
    /// Up to here a look-up compares pointers one after another.
    static constexpr std::uint32_t kLinear = 16;

    std::uint64_t hash = 0;
    std::uint64_t indexSize = 0; ///< a power of two, or 0
    std::uint64_t bytes = 0;     ///< of the shape and its keys

    const Key* keys() const { return reinterpret_cast<const Key*>(this + 1); }
    Key* keys() { return reinterpret_cast<Key*>(this + 1); }
    std::uint32_t* index() { return reinterpret_cast<std::uint32_t*>(keys() + size); }
    const std::uint32_t* index() const { return reinterpret_cast<const std::uint32_t*>(keys() + size); }

    std::uint32_t slotOf(const KeyObject* key) const {
        if (indexSize == 0) {
            for (std::uint32_t slot = 0; slot < size; ++slot) {
                if (keys()[slot].object() == key) {
                    return slot;
                }
            }
            return kNoSlot;
        }
        for (std::uint64_t place = key->hash & (indexSize - 1);; place = (place + 1) & (indexSize - 1)) {
            const std::uint32_t entry = index()[place];
            if (entry == 0) {
                return kNoSlot;
            }
            if (keys()[entry - 1].object() == key) {
                return entry - 1;
            }
        }
    }
};

// Every function below that answers a shape adds a reference to it for the caller.

/// The shape of these keys, or null when a key stands there twice.
const ShapeObject* internShape(std::span<const Key> keys);

/// The shape that followed `firstKey` when a dictionary was last built on this thread, or null.
const ShapeObject* expectedShape(const KeyObject* firstKey);
/// Makes `shape` what its first key lets expect.
void expectShape(const ShapeObject* shape);

/// `shape` (null for no keys) with `key`, which it has not, at its end.
const ShapeObject* shapeWithKey(const ShapeObject* shape, const Key& key);

/// `shape` without the key at `slot`; null when none is left.
const ShapeObject* shapeWithoutKey(const ShapeObject* shape, std::uint32_t slot);

/// `shape` with "_" for every " " in its keys; itself when there is none.
const ShapeObject* shapeWithoutSpaces(const ShapeObject* shape);

void releaseShape(const ShapeObject* shape);

} // namespace vela::detail
