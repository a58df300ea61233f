// Whatever the reader of the text form takes is written as text and read again as the same value.
#include "common/values/TextPropertyList.h"
#include "common/values/TextualForm.h"

#include <cstdint>
#include <cstdlib>
#include <iostream>

namespace {

void require(bool holds, const char* what, std::string_view text) {
    if (!holds) {
        std::cerr << what << ":\n" << text << '\n';
        std::abort();
    }
}

/// Escapes make a text grow, never more than this.
constexpr std::size_t kGrowth = 16;

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    using namespace vela;
    // An empty input has no pointer that a string view may have.
    const std::string text(data, data + size);
    const TextPropertyListLimits limits{.bytes = 64 * 1024, .depth = 32, .values = 1000};
    const auto first = readTextPropertyList(text, limits);
    if (const auto* const error = std::get_if<TextPropertyListError>(&first)) {
        require(error->line >= 1 && error->column >= 1 && !error->reason.empty(), "an error without a place", text);
        return 0;
    }
    // Inside an array, a string that stands alone gets the quotation marks that it needs.
    const Value value(Array{std::get<Value>(first)});
    const std::string written = textualForm(value);
    const TextPropertyListLimits wider{
        .bytes = limits.bytes * kGrowth, .depth = limits.depth + 1, .values = limits.values + 1};
    const auto second = readTextPropertyList(written, wider);
    require(std::holds_alternative<Value>(second), "what was written is refused", written);
    require(std::get<Value>(second) == value, "what was written is another value", written);
    return 0;
}
