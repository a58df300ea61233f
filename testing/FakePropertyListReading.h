// Property lists in their text form, by the true reader, and whatever values a test says that some bytes are. Not to be
// changed while others use it.
#pragma once

#include "common/values/TextPropertyList.h"
#include "common/values/TextualForm.h"
#include "platform/PropertyListReading.h"

#include <map>
#include <string>
#include <string_view>
#include <utility>
#include <variant>

namespace vela::testing {

class FakePropertyListReading final : public platform::PropertyListReading {
public:
    /// Exactly `bytes` are `value`: for numbers, dates and the like, which the text form does not have.
    void set(const std::string& bytes, Value value) { values_[bytes] = std::move(value); }

    platform::Result<Value> read(std::string_view bytes, const platform::PropertyListLimits& limits) const override {
        if (const auto found = values_.find(std::string(bytes)); found != values_.end()) {
            return found->second;
        }
        auto read = readTextPropertyList(bytes, {limits.bytes, limits.depth, limits.values});
        if (const auto* const error = std::get_if<TextPropertyListError>(&read)) {
            return platform::Failure{0, "property list: line " + std::to_string(error->line) + ", column " +
                                            std::to_string(error->column) + ": " + error->reason};
        }
        return std::get<Value>(std::move(read));
    }
    platform::Result<std::string> write(ValueRef value, platform::PropertyListFormat) const override {
        return textualForm(value);
    }

private:
    std::map<std::string, Value> values_;
};

} // namespace vela::testing
