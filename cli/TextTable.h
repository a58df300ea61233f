// Rows of text in aligned columns, for a person. Confined to its owner's thread.
#pragma once

#include <iosfwd>
#include <string>
#include <string_view>
#include <vector>

namespace vela {

class TextTable {
public:
    /// `headings` also tells how many cells every row has.
    explicit TextTable(std::vector<std::string> headings) { rows_.push_back({std::move(headings), false}); }

    /// A dim row is less interesting than the others.
    void add(std::vector<std::string> cells, bool dim = false);

    /// Columns are as wide as their widest cell, counted in characters.
    void print(std::ostream& out, bool colour) const;

private:
    struct Row {
        std::vector<std::string> cells;
        bool dim;
    };

    std::vector<std::size_t> columns() const;

    std::vector<Row> rows_; ///< the headings first
};

} // namespace vela
