// Arrays and dictionaries of values, and their builders.
//
// A dictionary keeps its entries in the order in which its keys were first added. Its key list (the "shape") is shared
// by all dictionaries that have the same keys in the same order, so that a dictionary is one block of values, a step
// that changes keys ("tag it", "drop the spaces") is remembered as a step from one shape to another, and equal messages
// are compared by a walk over two blocks.
#pragma once

#include "common/values/Key.h"
#include "common/values/Shape.h"
#include "common/values/Value.h"

#include <array>
#include <functional>
#include <initializer_list>
#include <iterator>
#include <memory>
#include <span>
#include <string>
#include <vector>

namespace vela {

class Array {
public:
    /// No values.
    Array() = default;
    /// `Array{1, "two"}`. One array as the only element is written `Array{Value(inner)}`: compilers take `Array{inner}`
    /// for a copy or for a nesting as they like.
    Array(std::initializer_list<Value> values);
    Array(const Array& other) : object_(other.object_) { detail::retain(object_); }
    Array(Array&& other) noexcept : object_(std::exchange(other.object_, nullptr)) {}
    Array& operator=(Array other) noexcept {
        std::swap(object_, other.object_);
        return *this;
    }
    ~Array() { detail::releaseValue(ValueKind::Array, detail::payloadOf(object_)); }

    std::size_t size() const { return object_ == nullptr ? 0 : object_->size; }
    bool empty() const { return object_ == nullptr; }
    ValueRef operator[](std::size_t index) const {
        assert(index < size());
        return {object_->kinds()[index], object_->payloads()[index]};
    }

    class Iterator {
    public:
        using iterator_category = std::input_iterator_tag;
        using value_type = ValueRef;
        using difference_type = std::ptrdiff_t;
        using reference = ValueRef;
        using pointer = void;
        ValueRef operator*() const { return (*array_)[index_]; }
        Iterator& operator++() {
            ++index_;
            return *this;
        }
        Iterator operator++(int) {
            const Iterator before = *this;
            ++index_;
            return before;
        }
        bool operator==(const Iterator& other) const { return index_ == other.index_; }

    private:
        friend class Array;
        Iterator(const Array* array, std::size_t index) : array_(array), index_(index) {}
        const Array* array_;
        std::size_t index_;
    };
    Iterator begin() const { return {this, 0}; }
    Iterator end() const { return {this, size()}; }

    friend bool operator==(const Array& left, const Array& right);

private:
    friend class ArrayBuilder;
    friend class Value;
    friend class ValueRef;
    explicit Array(detail::ArrayObject* retained) : object_(retained) {}

    detail::ArrayObject* object_ = nullptr;
};

class ArrayBuilder {
public:
    /// Appends `value`, which must not be none.
    void add(Value value) {
        assert(value);
        values_.push_back(std::move(value));
    }
    std::size_t size() const { return values_.size(); }
    /// The array; the builder is empty afterwards.
    Array build();

private:
    std::vector<Value> values_;
};

class Dictionary {
public:
    /// No entries.
    Dictionary() = default;
    struct Initial {
        std::string_view key;
        Value value;
    };
    /// `{{"a", 1}, {"b", true}}`; a repeated key keeps its first place and takes its last value.
    Dictionary(std::initializer_list<Initial> entries);
    Dictionary(const Dictionary& other) : object_(other.object_) { detail::retain(object_); }
    Dictionary(Dictionary&& other) noexcept : object_(std::exchange(other.object_, nullptr)) {}
    Dictionary& operator=(Dictionary other) noexcept {
        std::swap(object_, other.object_);
        return *this;
    }
    ~Dictionary() { detail::releaseValue(ValueKind::Dictionary, detail::payloadOf(object_)); }

    std::size_t size() const { return object_ == nullptr ? 0 : object_->size; }
    bool empty() const { return object_ == nullptr; }

    /// The value of `key`, or none.
    ValueRef find(const Key& key) const {
        if (object_ == nullptr) {
            return {};
        }
        return at(object_->shape->slotOf(key.object()));
    }
    ValueRef find(std::string_view key) const;
    bool contains(const Key& key) const { return static_cast<bool>(find(key)); }
    bool contains(std::string_view key) const { return static_cast<bool>(find(key)); }

    // Copies that differ in one step. The values are shared.
    /// With `key` set to `value` (not none): in its place when it is there, else at the end.
    [[nodiscard]] Dictionary setting(const Key& key, Value value) const;
    /// Without `key`; itself when it is absent.
    [[nodiscard]] Dictionary removing(const Key& key) const;
    /// With every " " in a key replaced by "_"; where two keys become one, the place is the first's and the value the
    /// last's. Itself when no key has a space.
    [[nodiscard]] Dictionary replacingSpacesInKeys() const;
    /// With all entries of `other` set.
    [[nodiscard]] Dictionary merging(const Dictionary& other) const;

    struct Entry {
        const Key& key;
        ValueRef value;
    };
    class Iterator {
    public:
        using iterator_category = std::input_iterator_tag;
        using value_type = Entry;
        using difference_type = std::ptrdiff_t;
        using reference = Entry;
        using pointer = void;
        Entry operator*() const { return {dictionary_->object_->shape->keys()[slot_], dictionary_->at(slot_)}; }
        Iterator& operator++() {
            ++slot_;
            return *this;
        }
        Iterator operator++(int) {
            const Iterator before = *this;
            ++slot_;
            return before;
        }
        bool operator==(const Iterator& other) const { return slot_ == other.slot_; }

    private:
        friend class Dictionary;
        Iterator(const Dictionary* dictionary, std::uint32_t slot) : dictionary_(dictionary), slot_(slot) {}
        const Dictionary* dictionary_;
        std::uint32_t slot_;
    };
    Iterator begin() const { return {this, 0}; }
    Iterator end() const { return {this, static_cast<std::uint32_t>(size())}; }

    /// Whether both are the very same object.
    bool isSameObject(const Dictionary& other) const { return object_ == other.object_; }
    /// Whether both have the same keys in the same order and, bit by bit, the same values: texts and containers are the
    /// same objects. Then they are written alike; if not, they may still be equal.
    bool hasSameEntries(const Dictionary& other) const;
    /// Whether both have the same keys in the same order.
    bool hasSameKeysInOrder(const Dictionary& other) const {
        return (object_ == nullptr ? nullptr : object_->shape) ==
               (other.object_ == nullptr ? nullptr : other.object_->shape);
    }
    /// Equal for dictionaries with the same keys in the same order; good while one of them lives.
    std::size_t hashOfKeys() const { return std::hash<const void*>()(object_ == nullptr ? nullptr : object_->shape); }
    friend bool operator==(const Dictionary& left, const Dictionary& right);
    /// Equality of what is left of both without the keys `ignored`, which may be absent.
    friend bool equalExcept(const Dictionary& left, const Dictionary& right, std::span<const Key> ignored);

private:
    friend class DictionaryBuilder;
    friend class Value;
    friend class ValueRef;
    friend std::size_t memoryOf(const Dictionary& dictionary);
    explicit Dictionary(detail::DictionaryObject* retained) : object_(retained) {}

    ValueRef at(std::uint32_t slot) const {
        if (slot == detail::kNoSlot) {
            return {};
        }
        return {object_->kinds()[slot], object_->payloads()[slot]};
    }

    detail::DictionaryObject* object_ = nullptr;
};

bool equalExcept(const Dictionary& left, const Dictionary& right, std::span<const Key> ignored);

/// As of a value that holds it.
inline std::size_t memoryOf(const Dictionary& dictionary) {
    return detail::memoryOf(ValueKind::Dictionary, detail::payloadOf(dictionary.object_));
}

/// Collects entries and makes a dictionary of them. The keys that followed last time on this thread after the same
/// first key are expected again: while that holds, a key given as text costs one comparison and no look-up.
class DictionaryBuilder {
public:
    DictionaryBuilder() = default;
    ~DictionaryBuilder();
    DictionaryBuilder(const DictionaryBuilder&) = delete;
    DictionaryBuilder& operator=(const DictionaryBuilder&) = delete;

    /// Adds an entry; `value` must not be none. A key added again keeps its first place and takes the last value.
    void add(const Key& key, Value value) {
        const std::uint32_t slot = nextSlot();
        if (expected_ != nullptr && slot < expected_->size && expected_->keys()[slot] == key) {
            put(slot, value);
            return;
        }
        addUnexpected(slot, Key(key), value);
    }
    void add(std::string_view key, Value value) {
        const std::uint32_t slot = nextSlot();
        if (expected_ != nullptr && slot < expected_->size && expected_->keys()[slot] == key) {
            put(slot, value);
            return;
        }
        addUnexpected(slot, Key(key), value);
    }

    /// Entries added so far, repeated keys included.
    std::size_t size() const { return size_; }

    /// The dictionary; the builder is empty afterwards.
    Dictionary build();

private:
    static constexpr std::uint32_t kInPlace = 24;

    std::uint32_t nextSlot() {
        if (size_ == capacity_) [[unlikely]] {
            grow();
        }
        return size_;
    }
    void put(std::uint32_t slot, Value& value) {
        assert(value);
        kinds_[slot] = value.kind_;
        payloads_[slot] = value.take();
        size_ = slot + 1;
    }
    void addUnexpected(std::uint32_t slot, Key key, Value& value);
    void leaveExpected();
    void grow();
    Dictionary make(const detail::ShapeObject* shape);
    Dictionary buildWithRepeatedKeys();
    void clear();

    std::uint32_t size_ = 0;
    std::uint32_t capacity_ = kInPlace;
    const detail::ShapeObject* expected_ = nullptr; ///< referenced; the keys so far are its first `size_`
    std::uint64_t* payloads_ = payloadsInPlace_;
    ValueKind* kinds_ = kindsInPlace_;
    std::vector<Key> keys_; ///< all keys so far once the expectation failed
    std::uint64_t payloadsInPlace_[kInPlace];
    ValueKind kindsInPlace_[kInPlace];
    std::unique_ptr<std::uint64_t[]> morePayloads_;
    std::unique_ptr<ValueKind[]> moreKinds_;
};

inline Value::Value(Array array)
    : payload_(detail::payloadOf(std::exchange(array.object_, nullptr))),
      kind_(ValueKind::Array) {}
inline Value::Value(Dictionary dictionary)
    : payload_(detail::payloadOf(std::exchange(dictionary.object_, nullptr))),
      kind_(ValueKind::Dictionary) {}

} // namespace vela
