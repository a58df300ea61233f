#include "platform/sqlite/ShapeTable.h"

#include "common/values/Json.h"

#include <algorithm>
#include <functional>
#include <limits>
#include <string_view>
#include <utility>

namespace vela::platform {

namespace {

std::string keysText(const Dictionary& payload) {
    std::string text = "[";
    for (const auto& [key, value] : payload) {
        text += text.size() > 1 ? "," : "";
        appendJsonString(text, key.text());
    }
    return text + "]";
}

Dictionary keysOnly(const Dictionary& payload) {
    DictionaryBuilder keys;
    for (const auto& [key, value] : payload) {
        keys.add(key, false);
    }
    return keys.build();
}

} // namespace

std::size_t ShapeTable::Hash::operator()(const Wanted& wanted) const {
    constexpr std::size_t kFactor = 0x9E3779B97F4A7C15;
    const std::size_t hash =
        std::hash<std::string_view>()(wanted.name.view()) + static_cast<std::size_t>(wanted.backend) + 1;
    return (hash ^ wanted.payload.hashOfKeys()) * kFactor;
}

ShapeTable::ShapeTable(SqliteDatabase& database, const Bounds& bounds) : database_(database), bounds_(bounds) {}

bool ShapeTable::load(std::int64_t lastSeq) {
    find_ = database_.prepare("SELECT shape FROM shape WHERE backend = ?1 AND name = ?2 AND keys = ?3");
    insert_ = database_.prepare("INSERT INTO shape(backend, name, keys) VALUES(?1, ?2, ?3) RETURNING shape");
    list_ = database_.prepare("SELECT shape, length(CAST(name AS BLOB)) + length(CAST(keys AS BLOB)) FROM shape "
                              "WHERE backend = ?1");
    remove_ = database_.prepare("DELETE FROM shape WHERE shape = ?1");
    if (!find_ || !insert_ || !list_ || !remove_) {
        return false;
    }
    return rolledBack(lastSeq);
}

bool ShapeTable::rolledBack(std::int64_t lastSeq) {
    known_.clear();
    loadedAt_ = lastSeq;
    for (std::size_t backend = 0; backend < kDeliveryBackends; ++backend) {
        Part& part = parts_[backend];
        part.shapes = 0;
        part.bytes = 0;
        part.collectBehind = 0;
        list_.bind(1, static_cast<std::int64_t>(backend));
        SqliteStatement::Step step = list_.step();
        for (; step == SqliteStatement::Step::Row; step = list_.step()) {
            ++part.shapes;
            part.bytes += list_.integer(1);
        }
        list_.reset();
        if (step == SqliteStatement::Step::Failed) {
            return false;
        }
    }
    return true;
}

std::optional<std::int64_t> ShapeTable::shapeOf(DeliveryBackend backend, const String& name, const Dictionary& payload,
                                                std::int64_t seq) {
    const Wanted wanted{backend, name, payload};
    const auto found = known_.find(wanted);
    if (found != known_.end()) {
        found->second.lastUsed = seq;
        return found->second.number;
    }
    return intern(wanted, seq);
}

std::optional<std::int64_t> ShapeTable::intern(const Wanted& wanted, std::int64_t seq) {
    const std::string keys = keysText(wanted.payload);
    const std::size_t bytes = keys.size() + wanted.name.view().size();
    if (bytes > bounds_.longestShape) {
        return kNoShape;
    }
    std::optional<std::int64_t> number = findStored(wanted, keys);
    if (number == kNoShape) {
        if (!hasRoom(part(wanted.backend), bytes) && !removeUnused(wanted.backend)) {
            return std::nullopt;
        }
        if (!hasRoom(part(wanted.backend), bytes)) {
            return kNoShape;
        }
        number = insert(wanted, keys, seq);
    }
    if (number) {
        known_.emplace(Key{wanted.backend, wanted.name, keysOnly(wanted.payload)}, Shape{*number, seq});
    }
    return number;
}

std::optional<std::int64_t> ShapeTable::findStored(const Wanted& wanted, const std::string& keys) {
    find_.bind(1, static_cast<std::int64_t>(wanted.backend));
    find_.bindText(2, wanted.name.view());
    find_.bindText(3, keys);
    const SqliteStatement::Step step = find_.step();
    const std::int64_t number = step == SqliteStatement::Step::Row ? find_.integer(0) : kNoShape;
    find_.reset();
    return step == SqliteStatement::Step::Failed ? std::nullopt : std::optional(number);
}

std::optional<std::int64_t> ShapeTable::insert(const Wanted& wanted, const std::string& keys, std::int64_t seq) {
    insert_.bind(1, static_cast<std::int64_t>(wanted.backend));
    insert_.bindText(2, wanted.name.view());
    insert_.bindText(3, keys);
    if (insert_.step() != SqliteStatement::Step::Row) {
        insert_.reset();
        return std::nullopt;
    }
    const std::int64_t number = insert_.integer(0);
    insert_.reset();
    Part& to = part(wanted.backend);
    ++to.shapes;
    to.bytes += static_cast<std::int64_t>(keys.size() + wanted.name.view().size());
    to.collectBehind = std::min(to.collectBehind, seq);
    return number;
}

bool ShapeTable::hasRoom(const Part& part, std::size_t bytes) const {
    return part.shapes < bounds_.shapes && part.bytes + static_cast<std::int64_t>(bytes) <= bounds_.bytes;
}

std::unordered_map<std::int64_t, std::int64_t> ShapeTable::lastUses(DeliveryBackend backend) const {
    std::unordered_map<std::int64_t, std::int64_t> uses;
    for (const auto& [key, shape] : known_) {
        if (key.backend == backend) {
            // Keys of invalid bytes may be different and yet have one text.
            std::int64_t& newest = uses[shape.number];
            newest = std::max(newest, shape.lastUsed);
        }
    }
    return uses;
}

// A shape can go when its newest record is older than the oldest that is left.
bool ShapeTable::removeUnused(DeliveryBackend backend) {
    Part& of = part(backend);
    if (of.oldest <= of.collectBehind) {
        return true;
    }
    const std::unordered_map<std::int64_t, std::int64_t> uses = lastUses(backend);
    of.collectBehind = std::numeric_limits<std::int64_t>::max();
    std::vector<std::pair<std::int64_t, std::int64_t>> unused; // number and bytes
    list_.bind(1, static_cast<std::int64_t>(backend));
    SqliteStatement::Step step = list_.step();
    for (; step == SqliteStatement::Step::Row; step = list_.step()) {
        const auto use = uses.find(list_.integer(0));
        const std::int64_t lastUsed = use == uses.end() ? loadedAt_ : use->second;
        if (lastUsed < of.oldest) {
            unused.emplace_back(list_.integer(0), list_.integer(1));
        } else {
            of.collectBehind = std::min(of.collectBehind, lastUsed);
        }
    }
    list_.reset();
    if (step == SqliteStatement::Step::Failed) {
        return false;
    }
    for (const auto& [number, bytes] : unused) {
        remove_.bind(1, number);
        if (!remove_.run()) {
            return false;
        }
        --of.shapes;
        of.bytes -= bytes;
        std::erase_if(known_, [number = number](const auto& each) { return each.second.number == number; });
    }
    return true;
}

} // namespace vela::platform
