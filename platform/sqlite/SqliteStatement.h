// A prepared statement. Owned by one thread at a time, destroyed before its database.
#pragma once

#include "platform/Result.h"

#include <cstdint>
#include <optional>
#include <string_view>

struct sqlite3_stmt;

namespace vela::platform {

class SqliteStatement {
public:
    enum class Step : std::uint8_t { Row, Done, Failed };

    SqliteStatement() = default;
    /// Takes over a statement; null for none.
    explicit SqliteStatement(sqlite3_stmt* statement) : statement_(statement) {}
    SqliteStatement(SqliteStatement&& other) noexcept;
    SqliteStatement& operator=(SqliteStatement&& other) noexcept;
    SqliteStatement(const SqliteStatement&) = delete;
    SqliteStatement& operator=(const SqliteStatement&) = delete;
    ~SqliteStatement();

    explicit operator bool() const { return statement_ != nullptr; }

    // Parameters, from 1. Texts and bytes are borrowed until the statement is reset.
    void bind(int parameter, std::int64_t number);
    void bindReal(int parameter, double number);
    void bindText(int parameter, std::string_view text);
    void bindBytes(int parameter, std::string_view bytes);
    void bindNull(int parameter);
    template <class Number>
    void bind(int parameter, const std::optional<Number>& number) {
        if (number) {
            bind(parameter, static_cast<std::int64_t>(*number));
        } else {
            bindNull(parameter);
        }
    }

    Step step();
    /// Ready for the next run; keeps what is bound.
    void reset();
    /// Runs a statement that answers no rows, or whose rows nobody wants, and resets it.
    [[nodiscard]] bool run();

    // The row's columns, from 0; borrowed until the next step.
    bool isNull(int column) const;
    std::int64_t integer(int column) const;
    double real(int column) const;
    std::string_view text(int column) const;
    std::string_view bytes(int column) const;
    /// Length of a text or of bytes, without making a copy of them.
    std::int64_t length(int column) const;

private:
    sqlite3_stmt* statement_ = nullptr;
};

} // namespace vela::platform
