// The tables behind Key.h and Shape.h, and the caches that threads keep in front of them.
#include "common/values/Key.h"
#include "common/values/Shape.h"

#include <algorithm>
#include <array>
#include <bit>
#include <memory>
#include <mutex>
#include <numeric>
#include <random>
#include <string>

namespace vela {

namespace detail {

namespace {

__extension__ using Wide = unsigned __int128;

std::uint64_t mix(std::uint64_t left, std::uint64_t right) {
    const Wide product = static_cast<Wide>(left) * right;
    return static_cast<std::uint64_t>(product) ^ static_cast<std::uint64_t>(product >> 64U);
}

constexpr std::uint64_t kOddA = 0x9E3779B97F4A7C15;
constexpr std::uint64_t kOddB = 0xD6E8FEB86659FD93;

// Differs from process to process, so that nobody can choose keys that fall together.
std::uint64_t seed() {
    static const std::uint64_t value = [] {
        std::random_device device;
        return (static_cast<std::uint64_t>(device()) << 32U) | device();
    }();
    return value;
}

std::uint64_t hashText(std::string_view text, std::uint64_t start) {
    std::uint64_t hash = start ^ mix(text.size() + 1, kOddA);
    while (text.size() >= sizeof(std::uint64_t)) {
        std::uint64_t eight = 0;
        std::memcpy(&eight, text.data(), sizeof(eight));
        hash = mix(hash ^ eight, kOddB);
        text.remove_prefix(sizeof(eight));
    }
    std::uint64_t rest = 0;
    for (const char character : text) {
        rest = (rest << 8U) | static_cast<unsigned char>(character);
    }
    return mix(hash ^ rest, kOddA);
}

std::uint64_t hashKeys(std::span<const Key> keys) {
    std::uint64_t hash = kOddB;
    for (const Key& key : keys) {
        hash = mix(hash ^ key.object()->hash, kOddA);
    }
    return hash;
}

std::size_t textBytes(std::size_t size) { return (size + KeyObject::kQuotes + 15U) / 16U * 16U; }

std::uint64_t bytesOf(const KeyObject& key) { return sizeof(KeyObject) + textBytes(key.size); }

/// Without its keys.
std::size_t ownBytes(std::size_t keys, std::uint64_t indexSize) {
    return sizeof(ShapeObject) + keys * sizeof(Key) + indexSize * sizeof(std::uint32_t);
}

std::uint64_t bytesOf(const ShapeObject& shape) { return shape.bytes; }

// Objects found by hash. It holds one reference to each; those that it alone holds are dropped when it has doubled
// since the last sweep, in number or in bytes. Guarded by the mutex of `Interned`.
template <class ObjectType>
class Table {
public:
    template <class Matches>
    ObjectType* find(std::uint64_t hash, const Matches& matches) const {
        if (slots_.empty()) {
            return nullptr;
        }
        for (std::size_t place = hash & mask();; place = (place + 1) & mask()) {
            ObjectType* object = slots_[place];
            if (object == nullptr || (object->hash == hash && matches(*object))) {
                return object;
            }
        }
    }

    /// Takes over one reference. `drop` destroys what a sweep removes.
    template <class Drop>
    void insert(ObjectType* object, const Drop& drop) {
        if (count_ >= sweepAt_ || bytes_ >= sweepAtBytes_) {
            sweep(drop);
        }
        if ((count_ + 1) * 2 > slots_.size()) {
            rehash(std::max<std::size_t>(1024, slots_.size() * 2));
        }
        take(object);
    }

    std::size_t size() const { return count_; }
    std::uint64_t bytes() const { return bytes_; }

private:
    static constexpr std::size_t kFirstSweep = 4096;
    static constexpr std::uint64_t kFirstSweepBytes = 4 * 1024 * 1024;

    std::size_t mask() const { return slots_.size() - 1; }

    void place(ObjectType* object) {
        std::size_t place = object->hash & mask();
        while (slots_[place] != nullptr) {
            place = (place + 1) & mask();
        }
        slots_[place] = object;
    }

    void take(ObjectType* object) {
        place(object);
        ++count_;
        bytes_ += bytesOf(*object);
    }

    void rehash(std::size_t size) {
        std::vector<ObjectType*> old(size, nullptr);
        old.swap(slots_);
        for (ObjectType* object : old) {
            if (object != nullptr) {
                place(object);
            }
        }
    }

    template <class Drop>
    void sweep(const Drop& drop) {
        std::vector<ObjectType*> old(slots_.size(), nullptr);
        old.swap(slots_);
        count_ = 0;
        bytes_ = 0;
        for (ObjectType* object : old) {
            if (object == nullptr) {
                continue;
            }
            // References are only added by copying one or under the mutex, so a count of one stays one.
            if (object->references.load(std::memory_order_acquire) == 1) {
                drop(object);
            } else {
                take(object);
            }
        }
        sweepAt_ = std::max(kFirstSweep, count_ * 2);
        sweepAtBytes_ = std::max(kFirstSweepBytes, bytes_ * 2);
    }

    std::vector<ObjectType*> slots_;
    std::size_t count_ = 0;
    std::size_t sweepAt_ = kFirstSweep;
    std::uint64_t bytes_ = 0;
    std::uint64_t sweepAtBytes_ = kFirstSweepBytes;
};

struct Interned {
    std::mutex mutex;
    Table<KeyObject> keys;
    Table<ShapeObject> shapes;
};

// Never destroyed: constants in other files give keys back when the program ends.
Interned& interned() {
    static auto* tables = new Interned;
    return *tables;
}

void dropKey(KeyObject* key) {
    key->~KeyObject();
    ::operator delete(key);
}

void dropShape(ShapeObject* shape) {
    std::destroy_n(shape->keys(), shape->size);
    shape->~ShapeObject();
    ::operator delete(shape);
}

bool isPlain(std::string_view text) {
    return std::all_of(text.begin(), text.end(), [](char character) {
        return character >= ' ' && character < 0x7F && character != '"' && character != '\\';
    });
}

KeyObject* newKey(std::string_view text, std::uint64_t hash) {
    const std::size_t padded = textBytes(text.size());
    auto* key = ::new (::operator new(sizeof(KeyObject) + padded)) KeyObject;
    key->size = static_cast<std::uint32_t>(text.size());
    key->hash = hash;
    key->plain = isPlain(text);
    char* bytes = key->quoted();
    std::fill_n(bytes, padded, '\0');
    bytes[0] = '"';
    std::copy(text.begin(), text.end(), bytes + 1);
    bytes[text.size() + 1] = '"';
    bytes[text.size() + 2] = ':';
    return key;
}

bool hasRepeatedKey(std::span<const Key> keys) {
    std::vector<const KeyObject*> sorted(keys.size());
    std::transform(keys.begin(), keys.end(), sorted.begin(), [](const Key& key) { return key.object(); });
    std::sort(sorted.begin(), sorted.end());
    return std::adjacent_find(sorted.begin(), sorted.end()) != sorted.end();
}

void fillIndex(ShapeObject& shape) {
    if (shape.indexSize == 0) {
        return;
    }
    std::fill_n(shape.index(), shape.indexSize, 0U);
    for (std::uint32_t slot = 0; slot < shape.size; ++slot) {
        std::uint64_t place = shape.keys()[slot].object()->hash & (shape.indexSize - 1);
        while (shape.index()[place] != 0) {
            place = (place + 1) & (shape.indexSize - 1);
        }
        shape.index()[place] = slot + 1;
    }
}

ShapeObject* newShape(std::span<const Key> keys, std::uint64_t hash) {
    const std::uint64_t indexSize = keys.size() > ShapeObject::kLinear ? std::bit_ceil(keys.size() * 2) : 0;
    const std::size_t own = ownBytes(keys.size(), indexSize);
    auto* shape = ::new (::operator new(own)) ShapeObject;
    shape->size = static_cast<std::uint32_t>(keys.size());
    shape->hash = hash;
    shape->indexSize = indexSize;
    shape->bytes = std::accumulate(keys.begin(), keys.end(), std::uint64_t{own},
                                   [](std::uint64_t sum, const Key& key) { return sum + bytesOf(*key.object()); });
    std::uninitialized_copy(keys.begin(), keys.end(), shape->keys());
    fillIndex(*shape);
    return shape;
}

template <class ObjectType>
ObjectType* retained(ObjectType* object) {
    retain(object);
    return object;
}

// What one thread saw last. Every entry holds references, so that what it names lives; what is large is not kept so.
class ThreadCache {
public:
    ThreadCache() = default;
    ThreadCache(const ThreadCache&) = delete;
    ThreadCache& operator=(const ThreadCache&) = delete;
    ~ThreadCache() {
        for (KeyObject* key : keys_) {
            releaseKey(key);
        }
        for (const ShapeObject* shape : shapes_) {
            releaseIfAny(shape);
        }
        for (const ShapeObject* shape : expected_) {
            releaseIfAny(shape);
        }
        for (const Step& step : steps_) {
            forget(step);
        }
    }

    KeyObject* key(std::uint64_t hash, std::string_view text) const {
        KeyObject* key = keys_[hash % keys_.size()];
        return key != nullptr && key->hash == hash && key->view() == text ? retained(key) : nullptr;
    }
    void rememberKey(KeyObject* key) {
        if (key->size > kLargestKey) {
            return;
        }
        KeyObject*& place = keys_[key->hash % keys_.size()];
        releaseKey(std::exchange(place, retained(key)));
    }

    const ShapeObject* shape(std::uint64_t hash, std::span<const Key> keys) const {
        const ShapeObject* shape = shapes_[hash % shapes_.size()];
        if (shape == nullptr || shape->hash != hash || shape->size != keys.size() ||
            !std::equal(keys.begin(), keys.end(), shape->keys())) {
            return nullptr;
        }
        return retained(shape);
    }
    void rememberShape(const ShapeObject* shape) {
        if (shape->bytes <= kLargestShape) {
            replace(shapes_[shape->hash % shapes_.size()], shape);
        }
    }

    const ShapeObject* expected(const KeyObject* firstKey) const {
        const ShapeObject* shape = expected_[firstKey->hash % expected_.size()];
        return shape != nullptr && shape->keys()[0].object() == firstKey ? retained(shape) : nullptr;
    }
    void expect(const ShapeObject* shape) {
        if (shape->bytes > kLargestShape) {
            return;
        }
        replace(expected_[shape->keys()[0].object()->hash % expected_.size()], shape);
    }

    enum class StepKind : std::uint8_t { None, With, Without, WithoutSpaces };

    /// The shape that a step led to, or null when it is not remembered. `detail` is what the step took beside the
    /// shape.
    const ShapeObject* step(StepKind kind, const ShapeObject* from, std::uint64_t detail) const {
        const Step& step = steps_[place(kind, from, detail)];
        return step.kind == kind && step.from == from && step.detail == detail ? retained(step.to) : nullptr;
    }
    void rememberStep(StepKind kind, const ShapeObject* from, std::uint64_t detail, const KeyObject* key,
                      const ShapeObject* to) {
        if (to->bytes > kLargestShape || (from != nullptr && from->bytes > kLargestShape)) {
            return;
        }
        Step& step = steps_[place(kind, from, detail)];
        const Step old = std::exchange(step, Step{kind, retained(from), detail, retained(key), retained(to)});
        forget(old);
    }

private:
    struct Step {
        StepKind kind = StepKind::None;
        const ShapeObject* from = nullptr;
        std::uint64_t detail = 0;
        const KeyObject* key = nullptr; ///< keeps the key alive whose address `detail` is
        const ShapeObject* to = nullptr;
    };

    static std::size_t place(StepKind kind, const ShapeObject* from, std::uint64_t detail) {
        const auto address = static_cast<std::uint64_t>(reinterpret_cast<std::uintptr_t>(from));
        return mix(address ^ kOddA, detail ^ (static_cast<std::uint64_t>(kind) * kOddB)) % kSteps;
    }
    static void releaseIfAny(const ShapeObject* shape) {
        if (shape != nullptr) {
            releaseShape(shape);
        }
    }
    static void releaseKey(const KeyObject* key) {
        if (key != nullptr && releaseIsLast(key)) {
            destroyKey(const_cast<KeyObject*>(key));
        }
    }
    static void replace(const ShapeObject*& place, const ShapeObject* shape) {
        releaseIfAny(std::exchange(place, retained(shape)));
    }
    static void forget(const Step& step) {
        releaseIfAny(step.from);
        releaseIfAny(step.to);
        releaseKey(step.key);
    }

    static constexpr std::uint32_t kLargestKey = 1024;
    static constexpr std::uint64_t kLargestShape = 16 * 1024;
    static constexpr std::size_t kSteps = 128;
    std::array<KeyObject*, 256> keys_{};
    std::array<const ShapeObject*, 64> shapes_{};
    std::array<const ShapeObject*, 32> expected_{};
    std::array<Step, kSteps> steps_{};
};

// A plain pointer in front of the owner: reading it needs no guard. Null before the first use and after the thread's
// end, when destructors of other thread-local objects may still use values.
constinit thread_local ThreadCache* threadCachePointer = nullptr;
constinit thread_local bool threadCacheEnded = false;

struct ThreadCacheOwner {
    ThreadCache cache;
    ThreadCacheOwner() { threadCachePointer = &cache; }
    ThreadCacheOwner(const ThreadCacheOwner&) = delete;
    ThreadCacheOwner& operator=(const ThreadCacheOwner&) = delete;
    ~ThreadCacheOwner() {
        threadCachePointer = nullptr;
        threadCacheEnded = true;
    }
};

/// Null while the thread ends.
ThreadCache* threadCache() {
    if (threadCachePointer == nullptr && !threadCacheEnded) [[unlikely]] {
        static thread_local ThreadCacheOwner owner;
        return &owner.cache;
    }
    return threadCachePointer;
}

template <bool Create>
KeyObject* lookUpKey(std::string_view text) {
    const std::uint64_t hash = hashText(text, seed());
    ThreadCache* cache = threadCache();
    if (cache != nullptr) {
        if (KeyObject* key = cache->key(hash, text)) {
            return key;
        }
    }
    KeyObject* key = nullptr;
    {
        Interned& tables = interned();
        const std::scoped_lock lock(tables.mutex);
        key = tables.keys.find(hash, [text](const KeyObject& candidate) { return candidate.view() == text; });
        if (key == nullptr && Create) {
            key = newKey(text, hash);
            tables.keys.insert(key, dropKey);
        }
        retain(key);
    }
    if (key != nullptr && cache != nullptr) {
        cache->rememberKey(key);
    }
    return key;
}

} // namespace

KeyObject* internKey(std::string_view text) { return lookUpKey<true>(text); }

KeyObject* findKey(std::string_view text) { return lookUpKey<false>(text); }

void destroyKey(KeyObject* key) { dropKey(key); }

void releaseShape(const ShapeObject* shape) {
    if (releaseIsLast(shape)) {
        dropShape(const_cast<ShapeObject*>(shape));
    }
}

const ShapeObject* internShape(std::span<const Key> keys) {
    const std::uint64_t hash = hashKeys(keys);
    ThreadCache* cache = threadCache();
    if (cache != nullptr) {
        if (const ShapeObject* shape = cache->shape(hash, keys)) {
            return shape;
        }
    }
    const ShapeObject* shape = nullptr;
    {
        Interned& tables = interned();
        const std::scoped_lock lock(tables.mutex);
        shape = tables.shapes.find(hash, [keys](const ShapeObject& candidate) {
            return candidate.size == keys.size() && std::equal(keys.begin(), keys.end(), candidate.keys());
        });
        if (shape == nullptr) {
            if (hasRepeatedKey(keys)) {
                return nullptr;
            }
            ShapeObject* made = newShape(keys, hash);
            tables.shapes.insert(made, dropShape);
            shape = made;
        }
        retain(shape);
    }
    if (cache != nullptr) {
        cache->rememberShape(shape);
    }
    return shape;
}

const ShapeObject* expectedShape(const KeyObject* firstKey) {
    const ThreadCache* cache = threadCache();
    return cache == nullptr ? nullptr : cache->expected(firstKey);
}

void expectShape(const ShapeObject* shape) {
    if (ThreadCache* cache = threadCache()) {
        cache->expect(shape);
    }
}

const ShapeObject* shapeWithKey(const ShapeObject* shape, const Key& key) {
    ThreadCache* cache = threadCache();
    const std::uint64_t address = payloadOf(key.object());
    if (cache != nullptr) {
        if (const ShapeObject* known = cache->step(ThreadCache::StepKind::With, shape, address)) {
            return known;
        }
    }
    std::vector<Key> keys;
    if (shape != nullptr) {
        keys.assign(shape->keys(), shape->keys() + shape->size);
    }
    keys.push_back(key);
    const ShapeObject* result = internShape(keys);
    if (cache != nullptr) {
        cache->rememberStep(ThreadCache::StepKind::With, shape, address, key.object(), result);
    }
    return result;
}

const ShapeObject* shapeWithoutKey(const ShapeObject* shape, std::uint32_t slot) {
    if (shape->size == 1) {
        return nullptr;
    }
    ThreadCache* cache = threadCache();
    if (cache != nullptr) {
        if (const ShapeObject* known = cache->step(ThreadCache::StepKind::Without, shape, slot)) {
            return known;
        }
    }
    std::vector<Key> keys(shape->keys(), shape->keys() + shape->size);
    keys.erase(keys.begin() + slot);
    const ShapeObject* result = internShape(keys);
    if (cache != nullptr) {
        cache->rememberStep(ThreadCache::StepKind::Without, shape, slot, nullptr, result);
    }
    return result;
}

namespace {

const ShapeObject* makeShapeWithoutSpaces(const ShapeObject* shape) {
    const bool hasSpace = std::any_of(shape->keys(), shape->keys() + shape->size,
                                      [](const Key& key) { return key.text().find(' ') != std::string_view::npos; });
    if (!hasSpace) {
        return retained(shape);
    }
    std::vector<Key> keys;
    keys.reserve(shape->size);
    for (std::uint32_t slot = 0; slot < shape->size; ++slot) {
        std::string text(shape->keys()[slot].text());
        std::replace(text.begin(), text.end(), ' ', '_');
        keys.emplace_back(text);
    }
    return internShape(keys);
}

} // namespace

const ShapeObject* shapeWithoutSpaces(const ShapeObject* shape) {
    ThreadCache* cache = threadCache();
    if (cache != nullptr) {
        if (const ShapeObject* known = cache->step(ThreadCache::StepKind::WithoutSpaces, shape, 0)) {
            return known;
        }
    }
    const ShapeObject* result = makeShapeWithoutSpaces(shape);
    if (cache != nullptr && result != nullptr) {
        cache->rememberStep(ThreadCache::StepKind::WithoutSpaces, shape, 0, nullptr, result);
    }
    return result;
}

} // namespace detail

InternedCounts internedCounts() {
    detail::Interned& tables = detail::interned();
    const std::scoped_lock lock(tables.mutex);
    return {tables.keys.size(), tables.shapes.size(), tables.keys.bytes() + tables.shapes.bytes()};
}

} // namespace vela
