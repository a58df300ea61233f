// Rows of text in aligned columns, for a person, at once or page by page. Confined to its owner's thread.
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

    /// Prints the rows that were added since the last call and forgets them. The headings stand over the first page
    /// only, whose widths the columns keep: a longer cell of a later page moves what is behind it in its row.
    void printPage(std::ostream& out, bool colour);

private:
    struct Row {
        std::vector<std::string> cells;
        bool dim;
    };

    std::vector<std::size_t> columns() const;
    static void printRow(const Row& row, std::string_view mark, const std::vector<std::size_t>& widths,
                         std::ostream& out);
    std::string_view markOf(const Row& row, bool colour) const;

    std::vector<Row> rows_;           ///< the headings first
    std::vector<std::size_t> widths_; ///< of the first page; none before it
};

} // namespace vela
