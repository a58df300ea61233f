// Dictionary keys: one shared object per text, so that equal keys are the same pointer.
//
// Keys that nobody uses any more are dropped from the table in sweeps, so that a client which invents keys cannot make
// it grow for ever. Thread-safe.
#pragma once

#include "common/values/Object.h"

#include <string_view>

namespace vela {

namespace detail {

/// | Object | hash | plain | "text": | zeros up to a multiple of 16 |
///
/// The text stands as JSON writes a plain key, quotation marks and colon included, and may be read in blocks of 16
/// bytes.
struct KeyObject : Object {
    std::uint64_t hash = 0;
    bool plain = false; ///< ASCII without anything that JSON escapes

    static constexpr std::size_t kQuotes = 3;
    char* quoted() { return reinterpret_cast<char*>(this + 1); }
    std::string_view quoted() const { return {reinterpret_cast<const char*>(this + 1), size + kQuotes}; }
    std::string_view view() const { return quoted().substr(1, size); }
};

/// Finds or makes the key and adds a reference to it.
KeyObject* internKey(std::string_view text);
/// A reference to the key if there is one, else null: a key that does not exist is in no dictionary.
KeyObject* findKey(std::string_view text);
void destroyKey(KeyObject* key);

} // namespace detail

class Key {
public:
    explicit Key(std::string_view text) : object_(detail::internKey(text)) {}
    Key(const Key& other) : object_(other.object_) { detail::retain(object_); }
    Key(Key&& other) noexcept : object_(std::exchange(other.object_, nullptr)) {}
    Key& operator=(Key other) noexcept {
        std::swap(object_, other.object_);
        return *this;
    }
    ~Key() {
        if (object_ != nullptr && detail::releaseIsLast(object_)) {
            detail::destroyKey(object_);
        }
    }

    std::string_view text() const { return object_->view(); }
    friend bool operator==(const Key& left, const Key& right) { return left.object_ == right.object_; }
    friend bool operator==(const Key& left, std::string_view right) {
        const std::string_view text = left.text();
        if (text.size() != right.size()) {
            return false;
        }
        // The usual lengths without a call; a shorter text may not be read a word at a time.
        if (text.size() > 8) {
            return detail::sameBytes(text.data(), right.data(), left.object_->size);
        }
        return text.size() >= 4 ? detail::sameHalfWords(text.data(), right.data(), text.size()) : text == right;
    }

    const detail::KeyObject* object() const { return object_; }

private:
    friend class DictionaryBuilder;
    explicit Key(detail::KeyObject* retained) : object_(retained) {}

    detail::KeyObject* object_;
};

/// What the process-wide tables of keys and key lists hold, for inspection and tests.
struct InternedCounts {
    std::size_t keys = 0;
    std::size_t shapes = 0;
    std::uint64_t bytes = 0; ///< of both; a key counts once for each list that has it, and for itself
};
InternedCounts internedCounts();

} // namespace vela
