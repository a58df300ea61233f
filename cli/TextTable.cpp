#include "cli/TextTable.h"

#include <algorithm>
#include <cassert>
#include <ostream>

namespace vela {

namespace {

constexpr std::string_view kBold = "\033[1m";
constexpr std::string_view kDim = "\033[2m";
constexpr std::string_view kPlain = "\033[0m";
constexpr std::size_t kGap = 2;

/// Characters of UTF-8 text: the bytes that continue one do not count.
std::size_t width(std::string_view text) {
    return static_cast<std::size_t>(
        std::ranges::count_if(text, [](char byte) { return (static_cast<unsigned char>(byte) & 0xC0U) != 0x80U; }));
}

} // namespace

void TextTable::add(std::vector<std::string> cells, bool dim) {
    assert(cells.size() == rows_.front().cells.size());
    rows_.push_back({std::move(cells), dim});
}

std::vector<std::size_t> TextTable::columns() const {
    std::vector<std::size_t> widths(rows_.front().cells.size(), 0);
    for (const Row& row : rows_) {
        for (std::size_t column = 0; column < widths.size(); ++column) {
            widths[column] = std::max(widths[column], width(row.cells[column]));
        }
    }
    return widths;
}

void TextTable::print(std::ostream& out, bool colour) const {
    const std::vector<std::size_t> widths = columns();
    for (const Row& row : rows_) {
        printRow(row, markOf(row, colour), widths, out);
    }
}

void TextTable::printPage(std::ostream& out, bool colour) {
    const bool first = widths_.empty();
    if (first) {
        widths_ = columns();
    }
    for (std::size_t row = first ? 0 : 1; row < rows_.size(); ++row) {
        printRow(rows_[row], markOf(rows_[row], colour), widths_, out);
    }
    rows_.resize(1);
}

std::string_view TextTable::markOf(const Row& row, bool colour) const {
    if (!colour) {
        return "";
    }
    return &row == &rows_.front() ? kBold : row.dim ? kDim : std::string_view();
}

void TextTable::printRow(const Row& row, std::string_view mark, const std::vector<std::size_t>& widths,
                         std::ostream& out) {
    std::string line;
    for (std::size_t column = 0; column < widths.size(); ++column) {
        line += row.cells[column];
        if (column + 1 < widths.size()) {
            const std::size_t used = width(row.cells[column]);
            line.append(widths[column] - std::min(used, widths[column]) + kGap, ' ');
        }
    }
    out << mark << line << (mark.empty() ? "" : kPlain) << '\n';
}

} // namespace vela
