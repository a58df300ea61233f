#include "common/values/Dictionary.h"

#include <algorithm>
#include <cstring>
#include <numeric>

namespace vela {

namespace {

using detail::ArrayObject;
using detail::DictionaryObject;
using detail::ShapeObject;

/// Takes over the reference to `shape`. The values are not filled in.
DictionaryObject* newDictionary(const ShapeObject* shape) {
    auto* object = ::new (::operator new(sizeof(DictionaryObject) + detail::blockBytes(shape->size))) DictionaryObject;
    object->size = shape->size;
    object->shape = shape;
    detail::clearPadding(object->kinds(), object->size);
    return object;
}

void copyValues(const DictionaryObject& from, DictionaryObject& to, std::uint32_t count) {
    std::memcpy(to.payloads(), from.payloads(), count * sizeof(std::uint64_t));
    std::memcpy(to.kinds(), from.kinds(), count * sizeof(ValueKind));
    detail::forEachReference(from.kinds(), count, [&to](std::uint32_t slot) {
        detail::retain(detail::objectOf<const detail::Object>(to.payloads()[slot]));
    });
}

} // namespace

Array::Array(std::initializer_list<Value> values) {
    ArrayBuilder builder;
    for (const Value& value : values) {
        builder.add(value);
    }
    *this = builder.build();
}

bool operator==(const Array& left, const Array& right) {
    return detail::equal(ValueKind::Array, detail::payloadOf(left.object_), ValueKind::Array,
                         detail::payloadOf(right.object_));
}

Array ArrayBuilder::build() {
    if (values_.empty()) {
        return {};
    }
    const auto size = static_cast<std::uint32_t>(values_.size());
    auto* object = ::new (::operator new(sizeof(ArrayObject) + detail::blockBytes(size))) ArrayObject;
    object->size = size;
    detail::clearPadding(object->kinds(), size);
    for (std::uint32_t index = 0; index < object->size; ++index) {
        object->kinds()[index] = values_[index].kind();
        object->payloads()[index] = values_[index].take();
    }
    values_.clear();
    return Array(object);
}

Dictionary::Dictionary(std::initializer_list<Initial> entries) {
    DictionaryBuilder builder;
    for (const Initial& entry : entries) {
        builder.add(entry.key, entry.value);
    }
    *this = builder.build();
}

ValueRef Dictionary::find(std::string_view key) const {
    if (object_ == nullptr) {
        return {};
    }
    const ShapeObject& shape = *object_->shape;
    if (shape.indexSize == 0) {
        for (std::uint32_t slot = 0; slot < shape.size; ++slot) {
            if (shape.keys()[slot] == key) {
                return at(slot);
            }
        }
        return {};
    }
    detail::KeyObject* object = detail::findKey(key);
    if (object == nullptr) {
        return {};
    }
    const ValueRef value = at(shape.slotOf(object));
    if (detail::releaseIsLast(object)) {
        detail::destroyKey(object);
    }
    return value;
}

Dictionary Dictionary::setting(const Key& key, Value value) const {
    assert(value);
    const ShapeObject* shape = object_ == nullptr ? nullptr : object_->shape;
    const std::uint32_t slot = shape == nullptr ? detail::kNoSlot : shape->slotOf(key.object());
    DictionaryObject* copy = nullptr;
    std::uint32_t target = slot;
    if (slot != detail::kNoSlot) {
        detail::retain(shape);
        copy = newDictionary(shape);
        copyValues(*object_, *copy, object_->size);
        detail::releaseValue(copy->kinds()[slot], copy->payloads()[slot]);
    } else {
        copy = newDictionary(detail::shapeWithKey(shape, key));
        target = copy->size - 1;
        if (object_ != nullptr) {
            copyValues(*object_, *copy, object_->size);
        }
    }
    copy->kinds()[target] = value.kind();
    copy->payloads()[target] = value.take();
    return Dictionary(copy);
}

Dictionary Dictionary::removing(const Key& key) const {
    const std::uint32_t removed = object_ == nullptr ? detail::kNoSlot : object_->shape->slotOf(key.object());
    if (removed == detail::kNoSlot) {
        return *this;
    }
    const ShapeObject* shape = detail::shapeWithoutKey(object_->shape, removed);
    if (shape == nullptr) {
        return {};
    }
    DictionaryObject* copy = newDictionary(shape);
    for (std::uint32_t slot = 0; slot < copy->size; ++slot) {
        const std::uint32_t from = slot < removed ? slot : slot + 1;
        copy->kinds()[slot] = object_->kinds()[from];
        copy->payloads()[slot] = object_->payloads()[from];
        detail::retainValue(copy->kinds()[slot], copy->payloads()[slot]);
    }
    return Dictionary(copy);
}

Dictionary Dictionary::replacingSpacesInKeys() const {
    if (object_ == nullptr) {
        return {};
    }
    if (const ShapeObject* shape = detail::shapeWithoutSpaces(object_->shape)) {
        if (shape == object_->shape) {
            detail::releaseShape(shape);
            return *this;
        }
        DictionaryObject* copy = newDictionary(shape);
        copyValues(*object_, *copy, object_->size);
        return Dictionary(copy);
    }
    // Two keys became one.
    DictionaryBuilder builder;
    for (const auto& [key, value] : *this) {
        std::string text(key.text());
        std::replace(text.begin(), text.end(), ' ', '_');
        builder.add(text, Value(value));
    }
    return builder.build();
}

Dictionary Dictionary::merging(const Dictionary& other) const {
    if (empty()) {
        return other;
    }
    if (other.empty()) {
        return *this;
    }
    DictionaryBuilder builder;
    for (const Dictionary* dictionary : {this, &other}) {
        for (const auto& [key, value] : *dictionary) {
            builder.add(key, Value(value));
        }
    }
    return builder.build();
}

bool Dictionary::hasSameEntries(const Dictionary& other) const {
    if (object_ == nullptr || other.object_ == nullptr) {
        return object_ == other.object_;
    }
    return hasSameKeysInOrder(other) &&
           std::equal(object_->kinds(), object_->kinds() + size(), other.object_->kinds()) &&
           std::equal(object_->payloads(), object_->payloads() + size(), other.object_->payloads());
}

bool operator==(const Dictionary& left, const Dictionary& right) {
    return detail::equalDictionaries(left.object_, right.object_);
}

bool equalExcept(const Dictionary& left, const Dictionary& right, std::span<const Key> ignored) {
    const auto isIgnored = [ignored](const Key& key) {
        return std::find(ignored.begin(), ignored.end(), key) != ignored.end();
    };
    if (left.hasSameKeysInOrder(right)) {
        for (std::uint32_t slot = 0; slot < left.size(); ++slot) {
            if (!(left.at(slot) == right.at(slot)) && !isIgnored(left.object_->shape->keys()[slot])) {
                return false;
            }
        }
        return true;
    }
    const auto counted = [ignored](const Dictionary& dictionary) {
        return dictionary.size() -
               static_cast<std::size_t>(std::count_if(ignored.begin(), ignored.end(),
                                                      [&](const Key& key) { return dictionary.contains(key); }));
    };
    if (counted(left) != counted(right)) {
        return false;
    }
    return std::all_of(left.begin(), left.end(), [&](const Dictionary::Entry& entry) {
        return isIgnored(entry.key) || entry.value == right.find(entry.key);
    });
}

DictionaryBuilder::~DictionaryBuilder() { clear(); }

void DictionaryBuilder::addUnexpected(std::uint32_t slot, Key key, Value& value) {
    if (slot == 0) {
        expected_ = detail::expectedShape(key.object());
        if (expected_ != nullptr) {
            put(slot, value);
            return;
        }
    } else if (expected_ != nullptr) {
        leaveExpected();
    }
    keys_.push_back(std::move(key));
    put(slot, value);
}

void DictionaryBuilder::leaveExpected() {
    keys_.assign(expected_->keys(), expected_->keys() + size_);
    detail::releaseShape(std::exchange(expected_, nullptr));
}

void DictionaryBuilder::grow() {
    const std::uint32_t capacity = capacity_ * 2;
    auto payloads = std::make_unique<std::uint64_t[]>(capacity);
    auto kinds = std::make_unique<ValueKind[]>(capacity);
    std::copy_n(payloads_, size_, payloads.get());
    std::copy_n(kinds_, size_, kinds.get());
    morePayloads_ = std::move(payloads);
    moreKinds_ = std::move(kinds);
    payloads_ = morePayloads_.get();
    kinds_ = moreKinds_.get();
    capacity_ = capacity;
}

Dictionary DictionaryBuilder::make(const ShapeObject* shape) {
    DictionaryObject* object = newDictionary(shape);
    std::memcpy(object->payloads(), payloads_, size_ * sizeof(std::uint64_t));
    std::memcpy(object->kinds(), kinds_, size_ * sizeof(ValueKind));
    size_ = 0;
    keys_.clear();
    return Dictionary(object);
}

Dictionary DictionaryBuilder::build() {
    if (size_ == 0) {
        return {};
    }
    if (expected_ != nullptr) {
        if (size_ == expected_->size) {
            return make(std::exchange(expected_, nullptr));
        }
        leaveExpected();
    }
    const ShapeObject* shape = detail::internShape(keys_);
    if (shape == nullptr) {
        return buildWithRepeatedKeys();
    }
    detail::expectShape(shape);
    return make(shape);
}

Dictionary DictionaryBuilder::buildWithRepeatedKeys() {
    // Sorted by key and then by place, so that the first and the last of each key stand at the ends of its run.
    std::vector<std::uint32_t> order(size_);
    std::iota(order.begin(), order.end(), 0U);
    std::stable_sort(order.begin(), order.end(), [this](std::uint32_t left, std::uint32_t right) {
        return std::less<>()(keys_[left].object(), keys_[right].object());
    });
    std::vector<std::uint32_t> lastOfFirst(size_, detail::kNoSlot); // for a key's first place, its last one
    for (std::size_t begin = 0, end = 0; begin < order.size(); begin = end) {
        for (end = begin + 1; end < order.size() && keys_[order[end]] == keys_[order[begin]]; ++end) {
            detail::releaseValue(kinds_[order[end - 1]], payloads_[order[end - 1]]);
        }
        lastOfFirst[order[begin]] = order[end - 1];
    }
    std::vector<Key> keys;
    std::vector<std::uint64_t> payloads;
    std::vector<ValueKind> kinds;
    for (std::uint32_t slot = 0; slot < size_; ++slot) {
        if (const std::uint32_t last = lastOfFirst[slot]; last != detail::kNoSlot) {
            keys.push_back(keys_[slot]);
            payloads.push_back(payloads_[last]);
            kinds.push_back(kinds_[last]);
        }
    }
    std::copy(payloads.begin(), payloads.end(), payloads_);
    std::copy(kinds.begin(), kinds.end(), kinds_);
    size_ = static_cast<std::uint32_t>(keys.size());
    return make(detail::internShape(keys));
}

void DictionaryBuilder::clear() {
    for (std::uint32_t slot = 0; slot < size_; ++slot) {
        detail::releaseValue(kinds_[slot], payloads_[slot]);
    }
    size_ = 0;
    if (expected_ != nullptr) {
        detail::releaseShape(std::exchange(expected_, nullptr));
    }
}

} // namespace vela
